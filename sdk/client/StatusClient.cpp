#include "sdk/client/StatusClient.h"

#include <utility>

#include "protocol/QVStatusProtocol.h"
#include "sdk/common/ValueCoding.h"

namespace quorvel {

StatusReader::~StatusReader() = default;

}  // namespace quorvel

namespace qv::client {

using quorvel::StatusResult;

namespace {

/// A list of dictionaries, or one.
StatusResult resultFromWire(const platform::IPCArguments& reply) {
  StatusResult result;
  if (reply[0].getIf<platform::Dictionary>() != nullptr)
    result.entries.push_back(sdk::fromWire(reply[0].asDictionary()));
  for (const platform::Value& entry : reply[0].asArray()) result.entries.push_back(sdk::fromWire(entry.asDictionary()));
  return result;
}

}  // namespace

StatusClient::StatusClient(std::shared_ptr<platform::IPCService> ipc, platform::TimerService& timers,
                           platform::Executor& executor)
    : ipc_(std::move(ipc)),
      queue_(std::make_shared<platform::SerialQueue>("com.tarnwick.quorvel.status", executor)),
      link_(std::make_shared<DaemonLink>(*ipc_, timers, queue_, DaemonLink::Interfaces{statusProtocol(), nullptr},
                                         DaemonLink::Delegate{[] {}, [] {}})) {}

StatusClient::~StatusClient() {
  queue_->sync([this] { link_->close(); });
}

void StatusClient::ask(OutgoingCall call, Handler handler) {
  queue_->async(std::weak_ptr(link_), [call = std::move(call), handler = std::move(handler)](DaemonLink& link) {
    link.request(
        call, [handler](const platform::IPCArguments& reply) { handler(resultFromWire(reply)); },
        [handler](quorvel::Error error) {
          handler({std::move(error), {}});
        });
  });
}

void StatusClient::recordings(Handler handler) { ask(status::GetRecordings{}, std::move(handler)); }

void StatusClient::startConditions(std::string bundleID, bool system, bool microphone, Handler handler) {
  status::GetStartConditions call;
  call.bundleID = std::move(bundleID);
  call.systemRecording = system;
  call.microphoneEnabled = microphone;
  ask(call, std::move(handler));
}

void StatusClient::movies(Handler handler) { ask(status::GetMovies{}, std::move(handler)); }
void StatusClient::device(Handler handler) { ask(status::GetDevice{}, std::move(handler)); }

}  // namespace qv::client
