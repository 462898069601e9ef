#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "extensions/AnswerDeadline.h"
#include "extensions/QVBroadcastExtensionProxy.h"
#include "platform/threads/RareLog.h"
#include "protocol/SampleType.h"
#include "session/BroadcastPlan.h"
#include "session/RecordingOutput.h"

namespace qv {

/// A broadcast whose samples go to the upload extension one by one, with each step of the recording as an action. What
/// finds no link is lost: nothing waits for it.
///
/// Threading: as its contract says.
class SamplesOutput final : public RecordingOutput, public std::enable_shared_from_this<SamplesOutput> {
 public:
  SamplesOutput(const platform::Platform& platform, BroadcastPlan plan, OutputEvents events)
      : platform_(platform), plan_(std::move(plan)), events_(std::move(events)) {}
  /// Ends the link, and the extension with it.
  ~SamplesOutput() override;

  /// Launches the extension, or connects to the one that runs; ready when it has pinged.
  void prepare(ReadyHandler handler) override;
  void start(ReadyHandler handler) override;
  [[nodiscard]] bool appendVideo(const PlacedPicture& picture) override;
  void appendAppAudio(const PlacedSound& sound) override;
  void appendMicrophone(const PlacedSound& sound) override;
  void pause() override;
  void resume() override;
  void tellFrontmostApplication(const std::string& bundleID) override;
  /// Tells the extension, and waits for its answer for 10 s at most.
  void finish(platform::MediaTime endTime, FinishHandler handler) override;
  [[nodiscard]] OutputCounts counts() const override;

 private:
  using Link = std::shared_ptr<QVBroadcastExtensionProxy>;

  [[nodiscard]] platform::Result<Link> makeLink() const;
  void adopt(const Link& link);
  void launch(const Link& link, ReadyHandler handler);
  void linkFailed(const platform::Error& error);
  void letGo();
  [[nodiscard]] Link link();
  void _notifyExtensionOfAction(BroadcastAction action, std::function<void()> completion);
  /// The completion runs in any case: also when the extension fails, or has not answered in time.
  void notifyExtensionAndWait(BroadcastAction action, std::function<void()> completion);
  void _notifyExtensionOfVideoSampleBuffer(const PlacedPicture& picture, uint32_t sampleOrientation);
  void _notifyExtensionOfAudioSampleBuffer(const PlacedSound& sound, SampleType type);
  void _notifyExtensionOfFrontmostProcessBundleID(const std::string& bundleID);

  const platform::Platform& platform_;
  const BroadcastPlan plan_;
  const OutputEvents events_;
  mutable std::mutex mutex_;
  Link broadcastUploadExtensionProxy_;
  platform::RareLog absences_;
};

}  // namespace qv
