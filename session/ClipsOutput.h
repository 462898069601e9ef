#pragma once

#include <memory>
#include <string>

#include "platform/threads/Guarded.h"
#include "session/BroadcastPlan.h"
#include "session/ClipCutter.h"
#include "session/ClipHandover.h"
#include "session/RecordingOutput.h"
#include "session/RecordingSettings.h"

namespace qv {

/// A broadcast in movie clips: the cutter makes them, the hand-over gives them to the upload extension.
///
/// Threading: as its contract says.
class ClipsOutput final : public RecordingOutput, public std::enable_shared_from_this<ClipsOutput> {
 public:
  struct Clips {
    std::string bundleID;  ///< of the application that broadcasts
    platform::Size size;   ///< of the pictures of the first clip, as they are coded
    platform::Size windowSize;
    bool systemRecording = false;
  };
  ClipsOutput(std::shared_ptr<RecordingContext> context, Clips clips, QVBroadcastInfo info, OutputEvents events);

  void start(ReadyHandler handler) override;
  [[nodiscard]] bool appendVideo(const PlacedPicture& picture) override;
  void appendAppAudio(const PlacedSound& sound) override;
  void appendMicrophone(const PlacedSound& sound) override;
  void pause() override;
  /// The handler runs when the last clip was handed over; the extension then has its time to send it.
  void finish(platform::MediaTime endTime, FinishHandler handler) override;
  /// Of all clips together.
  [[nodiscard]] OutputCounts counts() const override;

 private:
  [[nodiscard]] Clip makeClip(int64_t number, platform::Size size);
  void configurationReceived(const QVBroadcastConfiguration& configuration);

  const std::shared_ptr<RecordingContext> context_;
  const Clips clips_;
  const QVBroadcastInfo info_;
  const OutputEvents events_;
  /// What the extension last asked for; it counts from the next clip on.
  platform::Guarded<QVBroadcastConfiguration> configuration_;
  struct Written {
    std::shared_ptr<const QVMovieWriter> last;  ///< of the newest clip
    uint64_t droppedBefore = 0;                 ///< pictures, of the clips before
  };
  platform::Guarded<Written> written_;
  std::shared_ptr<ClipHandover> handover_;
  std::shared_ptr<ClipCutter> cutter_;
};

}  // namespace qv
