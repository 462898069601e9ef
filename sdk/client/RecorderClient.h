#pragma once

#include <memory>

#include "platform/IPC.h"
#include "platform/threads/Timer.h"
#include "protocol/Calls.h"
#include "sdk/client/ApplicationCallbacks.h"
#include "sdk/client/quorvel/Recorder.h"

namespace qv::client {

class RecorderSession;

/// The recorder of an application, over some messaging service.
///
/// Translates requests and hands them to the session, which lives on a queue of its own.
///
/// Threading: thread-safe.
class RecorderClient final : public quorvel::Recorder {
 public:
  /// `ipc` and `timers` must outlive the recorder and everything queued for it. `executor` runs the
  /// library's own work; applications' handlers run as `options` say.
  RecorderClient(std::shared_ptr<platform::IPCService> ipc, platform::TimerService& timers,
                 platform::Executor& executor, quorvel::RecorderOptions options);
  ~RecorderClient() override;

  void start(quorvel::StartOptions options, std::function<void(quorvel::StartResult)> handler) override;
  void stop(std::function<void(quorvel::StopResult)> handler) override;
  void stop(quorvel::StopOptions options, std::function<void(quorvel::StopResult)> handler) override;
  void pause(FailureHandler onFailure) override;
  void resume(uint32_t window, FailureHandler onFailure) override;
  void setMicrophoneEnabled(bool enabled, FailureHandler onFailure) override;
  void updateProcessIDForAudioCapture(pid_t pid, FailureHandler onFailure) override;
  void discard(CompletionHandler handler) override;
  void saveVideoToCameraRoll(std::string movieURL, CompletionHandler handler) override;
  void currentState(std::function<void(quorvel::StateResult)> handler) override;

  void didBecomeActive(FailureHandler onFailure) override;
  void didResignActive(FailureHandler onFailure) override;
  void keepConnected(bool keep) override;

  void setupBroadcast(quorvel::BroadcastOptions options, CompletionHandler handler) override;
  void currentBroadcastImages(std::function<void(quorvel::BroadcastImagesResult)> handler) override;
  void systemBroadcastExtensions(std::function<void(quorvel::BroadcastExtensionsResult)> handler) override;
  void setBroadcastURL(std::string url, FailureHandler onFailure) override;

  void setHasUserConsentForCamera(bool consent, FailureHandler onFailure) override;
  void setHasUserConsentForMicrophone(bool consent, FailureHandler onFailure) override;
  void setMicrophoneEnabledPersistent(bool enabled, FailureHandler onFailure) override;
  void reportCameraUsage(int32_t cameraPosition, FailureHandler onFailure) override;

  [[nodiscard]] uint64_t droppedSamples() const override;
  void openMovie(std::string movieURL, std::function<void(quorvel::OpenMovieResult)> handler) override;

 private:
  /// Brings a failure to the application, where it asked for it.
  FailureHandler failure(FailureHandler onFailure) const;
  void tellActive(bool active, FailureHandler onFailure);
  void send(OutgoingCall call, FailureHandler onFailure);
  template <typename Result>
  void ask(OutgoingCall call, std::function<void(Result)> handler, Result (*decode)(const platform::IPCArguments&));

  const std::shared_ptr<platform::IPCService> ipc_;
  const std::shared_ptr<platform::SerialQueue> queue_;
  const std::shared_ptr<ApplicationCallbacks> callbacks_;
  const std::shared_ptr<RecorderSession> session_;
};

}  // namespace qv::client
