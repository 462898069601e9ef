#include <memory>
#include <mutex>

#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/Executor.h"
#include "platform/threads/Timer.h"
#include "sdk/client/RecorderClient.h"
#include "sdk/client/StatusClient.h"

namespace quorvel {

namespace {

/// One messaging service, with its thread, for all that the process has of this library; it goes with the last.
std::shared_ptr<qv::platform::IPCService> sharedMessaging() {
  static std::mutex mutex;
  static std::weak_ptr<qv::platform::IPCService> shared;
  std::lock_guard lock(mutex);
  auto service = shared.lock();
  if (!service) {
    // An application's only peer is the daemon, which it trusts and does not have to identify.
    service = std::make_shared<qv::platform::SdBusIPCService>([](qv::platform::IPCPeer&) {},
                                                              qv::platform::optionsForTrustedPeers());
    shared = service;
  }
  return service;
}

}  // namespace

std::unique_ptr<Recorder> Recorder::create(RecorderOptions options) {
  return std::make_unique<qv::client::RecorderClient>(sharedMessaging(), qv::platform::systemTimers(),
                                                      qv::platform::globalQueue(), std::move(options));
}

std::unique_ptr<StatusReader> StatusReader::create() {
  return std::make_unique<qv::client::StatusClient>(sharedMessaging(), qv::platform::systemTimers(),
                                                    qv::platform::globalQueue());
}

}  // namespace quorvel
