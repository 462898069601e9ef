#pragma once

#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "sdk/client/ApplicationCallbacks.h"
#include "sdk/client/DaemonLink.h"
#include "sdk/common/SoundTimeline.h"

namespace qv::client {

/// What the library knows of this application's recording, and the daemon's end of the conversation.
///
/// Follows whether a recording is in progress, so that the loss of the daemon is told as its end, and
/// repeats the application's activation on each new connection. Brings the daemon's callbacks to
/// the application, as its callbacks run.
///
/// Threading: on its queue only.
class RecorderSession : public std::enable_shared_from_this<RecorderSession> {
 public:
  /// The session is not of use before it is in a shared pointer; hence not a constructor.
  static std::shared_ptr<RecorderSession> create(platform::IPCService& ipc, platform::TimerService& timers,
                                                 std::shared_ptr<platform::SerialQueue> queue,
                                                 std::shared_ptr<ApplicationCallbacks> callbacks,
                                                 quorvel::Events events);

  [[nodiscard]] DaemonLink& link() { return *link_; }

  void start(const request::StartRecording& request, std::function<void(quorvel::StartResult)> handler);
  void stop(OutgoingCall request, std::function<void(quorvel::StopResult)> handler);
  void tellActive(bool active, DaemonLink::FailureHandler onFailure);
  /// A call from the daemon.
  void receive(std::string_view member, const platform::IPCArguments& arguments);

 private:
  RecorderSession(std::shared_ptr<ApplicationCallbacks> callbacks, quorvel::Events events);
  void connected();
  void lost();
  void receiveFrame(const callback::CaptureHandlerWithSample& call);
  void receiveSound(callback::CaptureHandlerWithAudioSample call);
  void daemonStopped(quorvel::StopResult result);
  /// Whether this tells the end of a recording in whose place another of ours already goes on.
  bool isWordOfReplaced(const quorvel::StopResult& result);
  template <typename... Parameters, typename... Given>
  void tell(const std::function<void(Parameters...)>& event, Given... arguments);

  const std::shared_ptr<ApplicationCallbacks> callbacks_;
  const quorvel::Events events_;
  std::shared_ptr<DaemonLink> link_;
  bool recording_ = false;
  uint64_t recordingNumber_ = 0;  // of the last started
  /// Own recordings that a later start of ours has ended; the daemon's word of it is still to come.
  std::deque<uint64_t> replaced_;
  std::optional<bool> active_;
  quorvel::SampleTime pauses_{0};  // before the captured samples that come now
  sdk::SoundTimeline sound_;
};

}  // namespace qv::client
