#include "sdk/client/RecorderSession.h"

#include <utility>

#include "sdk/client/RecordingErrors.h"
#include "sdk/client/WireValues.h"
#include "sdk/common/SampleCoding.h"

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

const char* activationMember(bool active) { return active ? "clientDidBecomeActive" : "clientDidResignActive"; }

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
  session->link_ = std::make_shared<DaemonLink>(ipc, timers, std::move(queue), std::make_shared<DaemonCalls>(weak),
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

void RecorderSession::start(IPCArguments arguments, std::function<void(StartResult)> handler) {
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
      "startRecordingWindowLayerContextIDs", std::move(arguments),
      [finish](const IPCArguments& reply) {
        finish({errorFromWire(reply[0]), reply[1].asBool(), reply[2].asBool()});
      },
      [finish](quorvel::Error error) {
        finish({std::move(error), false, false});
      });
}

void RecorderSession::stop(const char* member, IPCArguments arguments, std::function<void(StopResult)> handler) {
  auto finish = [weak = weak_from_this(), handler = std::move(handler)](StopResult result) {
    const auto self = weak.lock();
    if (!self) return;
    // A loss ends the recording by itself, told by this answer alone.
    self->recording_ = false;
    self->tell(handler, std::move(result));
  };
  link_->request(
      member, std::move(arguments),
      [finish](const IPCArguments& reply) {
        finish({errorFromWire(reply[1]), reply[0].asString()});
      },
      [finish](quorvel::Error error) {
        finish({std::move(error), {}});
      });
}

void RecorderSession::tellActive(bool active, DaemonLink::FailureHandler onFailure) {
  link_->send(activationMember(active), {}, std::move(onFailure));
  active_ = active;
}

void RecorderSession::connected() {
  pauses_ = {};
  sound_ = {};
  if (active_) link_->send(activationMember(*active_), {}, [](const quorvel::Error&) {});
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

void RecorderSession::receiveFrame(const IPCArguments& arguments) {
  auto frame = events_.videoFrame ? videoFrameFromWire(arguments) : std::nullopt;
  if (!frame) return;
  callbacks_->postSample(
      ApplicationCallbacks::SampleKind::Video,
      [event = events_.videoFrame, frame = std::move(*frame)]() mutable { event(std::move(frame)); });
}

void RecorderSession::receiveSound(const IPCArguments& arguments) {
  auto sample = events_.audioSample ? audioSampleFromWire(arguments) : std::nullopt;
  if (!sample || !sound_.place(*sample, pauses_)) return;
  callbacks_->postSample(
      ApplicationCallbacks::SampleKind::Audio,
      [event = events_.audioSample, sample = std::move(*sample)]() mutable { event(std::move(sample)); });
}

void RecorderSession::receive(std::string_view member, const IPCArguments& arguments) {
  const platform::Value none;
  const auto at = [&](size_t index) -> const platform::Value& {
    return index < arguments.size() ? arguments[index] : none;
  };
  if (member == "captureHandlerWithSample") {
    receiveFrame(arguments);
  } else if (member == "captureHandlerWithAudioSample") {
    receiveSound(arguments);
  } else if (member == "captureTimelineDidChange") {
    pauses_ = sdk::sampleTimeFromWire(at(0).asData()).value_or(pauses_);
  } else if (member == "stopRecordingWithError") {
    daemonStopped({errorFromWire(at(0)), at(1).asString()});
  } else if (member == "updateScreenRecordingState") {
    tell(events_.recordingStateChanged, at(0).asBool());
  } else if (member == "updateBroadcastServiceInfo") {
    tell(events_.broadcastServiceInfoChanged, fromWire(at(0).asDictionary()));
  } else if (member == "updateBroadcastURL") {
    tell(events_.broadcastURLChanged, at(0).asString());
  } else if (member == "recordingLockInterrupted") {
    tell(events_.recordingLockInterrupted, errorFromWire(at(0)).value_or(quorvel::Error{}));
  } else if (member == "recordingTimerDidUpdate") {
    tell(events_.recordingTimerChanged, at(0).asString());
  }
}

}  // namespace qv::client
