#pragma once

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

 private:
  void packageVideoSampleBufferForCapture(QVClientProxy& to, const platform::SampleBufferRef& sample);
  void packageAudioSampleBufferForCapture(const PlacedSound& sound, SampleType type);
  void tellTimeline(QVClientProxy& to, platform::MediaTime pauses);

  const Client client_;
  /// Sound and pictures come on threads of their own; a sample follows the timeline that it belongs to.
  std::mutex mutex_;
  /// Invalid until the first sample: a client may have a former capture's in mind.
  platform::MediaTime toldPauses_ = platform::MediaTime::invalid();
};

}  // namespace qv
