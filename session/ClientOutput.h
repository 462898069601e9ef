#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>

#include "session/QVClientProxy.h"
#include "session/RecordingOutput.h"

namespace qv {

/// Hands each sample to the client as it comes ("capture"). It makes no file.
///
/// Threading: as its contract says.
class ClientOutput final : public RecordingOutput {
 public:
  /// The client at the moment of the call; it changes when the application connects anew.
  using Client = std::function<std::shared_ptr<QVClientProxy>()>;
  explicit ClientOutput(Client client) : client_(std::move(client)) {}

  [[nodiscard]] bool appendVideo(const PlacedPicture& picture) override;
  void appendAppAudio(const PlacedSound& sound) override;
  void appendMicrophone(const PlacedSound& sound) override;
  void finish(platform::MediaTime, FinishHandler handler) override { handler({}); }
  [[nodiscard]] OutputCounts counts() const override { return {.droppedPictures = droppedPictures_->load()}; }

 private:
  void packageVideoSampleBufferForCapture(QVClientProxy& to, const platform::SampleBufferRef& sample);
  void packageAudioSampleBufferForCapture(const PlacedSound& sound, SampleType type);
  void tellTimeline(QVClientProxy& to, platform::MediaTime pauses);

  const Client client_;
  /// Whether a picture was sent is known later than this may live.
  const std::shared_ptr<std::atomic<uint64_t>> droppedPictures_ = std::make_shared<std::atomic<uint64_t>>(0);
  /// Sound and pictures come on threads of their own; a sample follows the timeline that it belongs to.
  std::mutex mutex_;
  /// Invalid until the first sample: a client may have a former capture's in mind.
  platform::MediaTime toldPauses_ = platform::MediaTime::invalid();
};

}  // namespace qv
