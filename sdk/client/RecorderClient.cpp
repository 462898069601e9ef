#include "sdk/client/RecorderClient.h"

#include <utility>

#include "platform/base/Value.h"
#include "sdk/client/RecorderErrors.h"
#include "sdk/client/RecorderSession.h"
#include "sdk/client/WireValues.h"

namespace quorvel {

Recorder::~Recorder() = default;

std::string filePath(std::string_view url) { return qv::platform::URL(std::string(url)).path(); }
std::vector<uint8_t> archivedConfiguration(const BroadcastConfiguration& configuration) {
  return qv::sdk::archive(configuration);
}

}  // namespace quorvel

namespace qv::client {

using platform::IPCArguments;
using quorvel::BroadcastExtensionsResult;
using quorvel::BroadcastImagesResult;
using quorvel::StartResult;
using quorvel::StateResult;
using quorvel::StopResult;

namespace {

BroadcastImagesResult imagesFromWire(const IPCArguments& reply) {
  return {std::nullopt, reply[0].asData(), reply[1].asData()};
}

BroadcastExtensionsResult extensionsFromWire(const IPCArguments& reply) {
  BroadcastExtensionsResult result{errorFromWire(reply[1].asDictionary()), {}};
  for (const platform::Value& extension : reply[0].asArray())
    result.extensions.push_back(extensionFromWire(extension.asDictionary()));
  return result;
}

quorvel::OpenMovieResult openMovieFromWire(const IPCArguments& reply) {
  quorvel::OpenMovieResult result{errorFromWire(reply[1].asDictionary()), -1, nullptr};
  const auto& files = reply[0].asArray();
  const auto* file = files.empty() ? nullptr : files.front().getIf<platform::SharedFileDescriptor>();
  if (result.error) return result;
  if (!file || !*file) return {libraryError(quorvel::kErrorUnknown, "the movie did not come with the answer"), -1, {}};
  result.file = (*file)->get();
  result.holder = *file;
  return result;
}

/// An application that the daemon does not know gets an empty state.
StateResult currentStateFromWire(const IPCArguments& reply) {
  return {std::nullopt, stateFromWire(reply[0].asDictionary())};
}

/// Requests whose only answer is whether they went well.
struct Outcome {
  std::optional<quorvel::Error> error;
};
Outcome outcomeFromWire(const IPCArguments& reply) {
  return {reply.empty() ? std::nullopt : errorFromWire(reply[0].asDictionary())};
}
std::function<void(Outcome)> outcomeHandler(quorvel::Recorder::CompletionHandler handler) {
  if (!handler) return {};
  return [handler = std::move(handler)](Outcome outcome) { handler(std::move(outcome.error)); };
}

}  // namespace

RecorderClient::RecorderClient(std::shared_ptr<platform::IPCService> ipc, platform::TimerService& timers,
                               platform::Executor& executor, quorvel::RecorderOptions options)
    : ipc_(std::move(ipc)),
      queue_(std::make_shared<platform::SerialQueue>("com.tarnwick.quorvel.client", executor)),
      callbacks_(std::make_shared<ApplicationCallbacks>(std::move(options.executor), executor)),
      session_(RecorderSession::create(*ipc_, timers, queue_, callbacks_, std::move(options.events))) {}

RecorderClient::~RecorderClient() {
  callbacks_->close();
  const auto close = [this] { session_->link().close(); };
  // A handler whose executor runs it at once may destroy the recorder on our own queue.
  queue_->isOnQueue() ? close() : queue_->sync(close);
}

template <typename Result>
void RecorderClient::ask(OutgoingCall call, std::function<void(Result)> handler,
                         Result (*decode)(const IPCArguments&)) {
  auto answer = [callbacks = callbacks_, handler = std::move(handler)](Result result) {
    if (handler) callbacks->post([handler, result = std::move(result)]() mutable { handler(std::move(result)); });
  };
  queue_->async(std::weak_ptr(session_),
                [call = std::move(call), answer = std::move(answer), decode](RecorderSession& session) mutable {
                  session.link().request(
                      std::move(call), [answer, decode](const IPCArguments& reply) { answer(decode(reply)); },
                      [answer](quorvel::Error error) {
                        Result result{};
                        result.error = std::move(error);
                        answer(std::move(result));
                      });
                });
}

void RecorderClient::send(OutgoingCall call, FailureHandler onFailure) {
  queue_->async(std::weak_ptr(session_),
                [call = std::move(call), fail = failure(std::move(onFailure))](RecorderSession& session) mutable {
                  session.link().send(std::move(call), std::move(fail));
                });
}

RecorderClient::FailureHandler RecorderClient::failure(FailureHandler onFailure) const {
  return [callbacks = callbacks_, onFailure = std::move(onFailure)](quorvel::Error error) {
    if (onFailure) callbacks->post([onFailure, error = std::move(error)]() mutable { onFailure(std::move(error)); });
  };
}

void RecorderClient::start(quorvel::StartOptions options, std::function<void(StartResult)> handler) {
  // The endpoint is the caller's only during this call.
  auto start = startRequest(options);
  if (!start) {
    callbacks_->post([handler = std::move(handler)] {
      if (handler) handler({libraryError(quorvel::kErrorUnknown, "the listener endpoint is not a descriptor")});
    });
    return;
  }
  queue_->async(std::weak_ptr(session_),
                [start = std::move(*start), handler = std::move(handler)](RecorderSession& session) mutable {
                  session.start(start, std::move(handler));
                });
}

void RecorderClient::stop(std::function<void(StopResult)> handler) {
  queue_->async(std::weak_ptr(session_), [handler = std::move(handler)](RecorderSession& session) mutable {
    session.stop(request::Stop{}, std::move(handler));
  });
}

void RecorderClient::stop(quorvel::StopOptions options, std::function<void(StopResult)> handler) {
  queue_->async(std::weak_ptr(session_), [options, handler = std::move(handler)](RecorderSession& session) mutable {
    session.stop(request::StopTrimmed{options.startClip.count(), options.endClip.count()}, std::move(handler));
  });
}

void RecorderClient::pause(FailureHandler onFailure) { send(request::Pause{}, std::move(onFailure)); }

void RecorderClient::resume(uint32_t window, FailureHandler onFailure) {
  send(request::Resume{window}, std::move(onFailure));
}

void RecorderClient::setMicrophoneEnabled(bool enabled, FailureHandler onFailure) {
  send(request::SetMicrophoneEnabled{enabled}, std::move(onFailure));
}

void RecorderClient::updateProcessIDForAudioCapture(pid_t pid, FailureHandler onFailure) {
  send(request::UpdateProcessID{static_cast<int32_t>(pid)}, std::move(onFailure));
}

void RecorderClient::discard(CompletionHandler handler) {
  ask<Outcome>(request::Discard{}, outcomeHandler(std::move(handler)), outcomeFromWire);
}

void RecorderClient::saveVideoToCameraRoll(std::string movieURL, CompletionHandler handler) {
  ask<Outcome>(request::SaveVideo{platform::URL(std::move(movieURL))}, outcomeHandler(std::move(handler)),
               outcomeFromWire);
}

void RecorderClient::currentState(std::function<void(StateResult)> handler) {
  ask<StateResult>(request::GetState{}, std::move(handler), currentStateFromWire);
}

void RecorderClient::didBecomeActive(FailureHandler onFailure) { tellActive(true, std::move(onFailure)); }
void RecorderClient::didResignActive(FailureHandler onFailure) { tellActive(false, std::move(onFailure)); }

void RecorderClient::tellActive(bool active, FailureHandler onFailure) {
  queue_->async(std::weak_ptr(session_),
                [active, fail = failure(std::move(onFailure))](RecorderSession& session) mutable {
                  session.tellActive(active, std::move(fail));
                });
}

void RecorderClient::keepConnected(bool keep) {
  queue_->async(std::weak_ptr(session_), [keep](RecorderSession& session) { session.link().setKeepsConnected(keep); });
}

void RecorderClient::setupBroadcast(quorvel::BroadcastOptions options, CompletionHandler handler) {
  ask<Outcome>(request::SetupBroadcast{std::move(options.hostBundleID), std::move(options.extensionBundleID),
                                       std::move(options.configuration), toWire(options.userInfo)},
               outcomeHandler(std::move(handler)), outcomeFromWire);
}

void RecorderClient::currentBroadcastImages(std::function<void(BroadcastImagesResult)> handler) {
  ask<BroadcastImagesResult>(request::GetBroadcastImages{}, std::move(handler), imagesFromWire);
}

void RecorderClient::systemBroadcastExtensions(std::function<void(BroadcastExtensionsResult)> handler) {
  ask<BroadcastExtensionsResult>(request::GetBroadcastExtensions{}, std::move(handler), extensionsFromWire);
}

void RecorderClient::setBroadcastURL(std::string url, FailureHandler onFailure) {
  send(request::SetBroadcastURL{std::move(url)}, std::move(onFailure));
}

void RecorderClient::setHasUserConsentForCamera(bool consent, FailureHandler onFailure) {
  send(request::SetCameraConsent{consent}, std::move(onFailure));
}

void RecorderClient::setHasUserConsentForMicrophone(bool consent, FailureHandler onFailure) {
  send(request::SetMicrophoneConsent{consent}, std::move(onFailure));
}

void RecorderClient::setMicrophoneEnabledPersistent(bool enabled, FailureHandler onFailure) {
  send(request::SetMicrophoneEnabledPersistent{enabled}, std::move(onFailure));
}

void RecorderClient::reportCameraUsage(int32_t cameraPosition, FailureHandler onFailure) {
  send(request::ReportCameraUsage{cameraPosition}, std::move(onFailure));
}

void RecorderClient::openMovie(std::string movieURL, std::function<void(quorvel::OpenMovieResult)> handler) {
  ask<quorvel::OpenMovieResult>(request::OpenMovie{platform::URL(std::move(movieURL))}, std::move(handler),
                                openMovieFromWire);
}

uint64_t RecorderClient::droppedSamples() const { return callbacks_->droppedSamples(); }

}  // namespace qv::client
