#include "sdk/client/RecorderSession.h"

#include <utility>

#include "platform/base/ValueTypes.h"
#include "sdk/client/RecorderErrors.h"
#include "sdk/client/WireValues.h"
#include "sdk/common/Samples.h"

namespace qv::client {

using platform::IPCArguments;
using quorvel::StartResult;
using quorvel::StopResult;

namespace {

/// The library's end of the connection. It does not keep the session alive.
class DaemonCalls final : public platform::IPCExportedObject {
 public:
  explicit DaemonCalls(std::weak_ptr<RecorderSession> session) : session_(std::move(session)) {}
  void handleCall(const std::shared_ptr<platform::IPCConnection>&, const platform::IPCOperation& operation,
                  IPCArguments arguments, platform::IPCReply) override {
    if (const auto session = session_.lock()) session->receive(operation.member, arguments);
  }

 private:
  const std::weak_ptr<RecorderSession> session_;
};

OutgoingCall activation(bool active) {
  return active ? OutgoingCall(request::DidBecomeActive{}) : OutgoingCall(request::DidResignActive{});
}

}  // namespace

std::shared_ptr<RecorderSession> RecorderSession::create(platform::IPCService& ipc, platform::TimerService& timers,
                                                         std::shared_ptr<platform::SerialQueue> queue,
                                                         std::shared_ptr<ApplicationCallbacks> callbacks,
                                                         quorvel::Events events) {
  std::shared_ptr<RecorderSession> session(new RecorderSession(std::move(callbacks), std::move(events)));
  const std::weak_ptr<RecorderSession> weak = session;
  DaemonLink::Delegate delegate;
  delegate.connected = [weak] {
    if (const auto self = weak.lock()) self->connected();
  };
  delegate.lost = [weak] {
    if (const auto self = weak.lock()) self->lost();
  };
  session->link_ = std::make_shared<DaemonLink>(
      ipc, timers, std::move(queue), DaemonLink::Interfaces{daemonProtocol(), std::make_shared<DaemonCalls>(weak)},
      std::move(delegate));
  return session;
}

RecorderSession::RecorderSession(std::shared_ptr<ApplicationCallbacks> callbacks, quorvel::Events events)
    : callbacks_(std::move(callbacks)), events_(std::move(events)) {}

template <typename... Parameters, typename... Given>
void RecorderSession::tell(const std::function<void(Parameters...)>& event, Given... arguments) {
  if (!event) return;
  callbacks_->post([event, ... arguments = std::move(arguments)]() mutable { event(std::move(arguments)...); });
}

void RecorderSession::start(const request::StartRecording& request, std::function<void(StartResult)> handler) {
  if (recording_) replaced_.push_back(recordingNumber_);
  auto finish = [weak = weak_from_this(), handler = std::move(handler)](StartResult result) {
    const auto self = weak.lock();
    if (!self) return;
    if (!result.error) {
      self->recording_ = true;
      ++self->recordingNumber_;
    }
    self->tell(handler, std::move(result));
  };
  link_->request(
      request,
      [finish](const IPCArguments& reply) {
        finish({errorFromWire(reply[0].asDictionary()), reply[1].asBool(), reply[2].asBool()});
      },
      [finish](quorvel::Error error) {
        finish({std::move(error), false, false});
      });
}

void RecorderSession::stop(OutgoingCall request, std::function<void(StopResult)> handler) {
  auto finish = [weak = weak_from_this(), handler = std::move(handler)](StopResult result) {
    const auto self = weak.lock();
    if (!self) return;
    // A loss ends the recording by itself, told by this answer alone.
    self->recording_ = false;
    self->tell(handler, std::move(result));
  };
  link_->request(
      std::move(request),
      [finish](const IPCArguments& reply) {
        finish({errorFromWire(reply[1].asDictionary()), reply[0].asString()});
      },
      [finish](quorvel::Error error) {
        finish({std::move(error), {}});
      });
}

void RecorderSession::tellActive(bool active, DaemonLink::FailureHandler onFailure) {
  link_->send(activation(active), std::move(onFailure));
  active_ = active;
}

void RecorderSession::connected() {
  pauses_ = {};
  sound_ = {};
  if (active_) link_->send(activation(*active_), [](const quorvel::Error&) {});
  tell(events_.connected);
}

void RecorderSession::lost() {
  replaced_.clear();
  if (std::exchange(recording_, false))
    tell(events_.stopped, StopResult{libraryError(quorvel::kErrorConnectionInterrupted), {}});
  tell(events_.interrupted);
}

bool RecorderSession::isWordOfReplaced(const StopResult& result) {
  const bool wasInterrupted = result.error && result.error->code == quorvel::kErrorInterrupted;
  if (!wasInterrupted || replaced_.empty()) return false;
  const uint64_t ended = replaced_.front();
  replaced_.pop_front();
  return ended != recordingNumber_;
}

void RecorderSession::daemonStopped(StopResult result) {
  if (isWordOfReplaced(result)) return;
  recording_ = false;
  tell(events_.stopped, std::move(result));
}

void RecorderSession::receiveFrame(const callback::CaptureHandlerWithSample& call) {
  const auto picture = events_.videoFrame ? pictureOf(call) : std::nullopt;
  if (!picture) return;
  callbacks_->postSample(
      ApplicationCallbacks::SampleKind::Video,
      [event = events_.videoFrame, frame = sdk::videoFrame(*picture)]() mutable { event(std::move(frame)); });
}

void RecorderSession::receiveSound(callback::CaptureHandlerWithAudioSample call) {
  auto sound = events_.audioSample ? soundOf(std::move(call)) : std::nullopt;
  if (!sound) return;
  quorvel::AudioSample sample = sdk::audioSample(std::move(*sound));
  if (!sound_.place(sample, pauses_)) return;
  callbacks_->postSample(
      ApplicationCallbacks::SampleKind::Audio,
      [event = events_.audioSample, sample = std::move(sample)]() mutable { event(std::move(sample)); });
}

void RecorderSession::receive(std::string_view member, const IPCArguments& arguments) {
  callback::All::dispatch(
      member, arguments,
      platform::Overloaded{
          [this](const callback::CaptureHandlerWithSample& call) { receiveFrame(call); },
          [this](callback::CaptureHandlerWithAudioSample&& call) { receiveSound(std::move(call)); },
          [this](const callback::CaptureTimelineDidChange& call) {
            if (const auto pauses = pausesOf(call)) pauses_ = sdk::sampleTime(*pauses);
          },
          [this](const callback::StopRecordingWithError& call) {
            daemonStopped({errorFromWire(call.error), call.movieURL.absoluteString()});
          },
          [this](const callback::UpdateScreenRecordingState& call) {
            tell(events_.recordingStateChanged, call.recording);
          },
          [this](const callback::UpdateBroadcastServiceInfo& call) {
            tell(events_.broadcastServiceInfoChanged, fromWire(call.serviceInfo));
          },
          [this](const callback::UpdateBroadcastURL& call) {
            tell(events_.broadcastURLChanged, call.broadcastURL.absoluteString());
          },
          [this](const callback::RecordingLockInterrupted& call) {
            tell(events_.recordingLockInterrupted, errorFromWire(call.error).value_or(quorvel::Error{}));
          },
          [this](const callback::RecordingTimerDidUpdate& call) { tell(events_.recordingTimerChanged, call.time); },
      });
}

}  // namespace qv::client
