#pragma once

#include <memory>
#include <string>

#include "platform/IPC.h"
#include "platform/threads/Timer.h"
#include "sdk/client/DaemonLink.h"
#include "sdk/client/quorvel/Status.h"

namespace qv::client {

/// The status reader, over some messaging service.
///
/// Threading: thread-safe; the link belongs to the queue.
class StatusClient final : public quorvel::StatusReader {
 public:
  /// `ipc` and `timers` must outlive it. `executor` runs the library's work, and the handlers.
  StatusClient(std::shared_ptr<platform::IPCService> ipc, platform::TimerService& timers, platform::Executor& executor);
  ~StatusClient() override;

  void recordings(Handler handler) override;
  void startConditions(std::string bundleID, bool system, bool microphone, Handler handler) override;
  void movies(Handler handler) override;
  void device(Handler handler) override;

 private:
  void ask(OutgoingCall call, Handler handler);

  const std::shared_ptr<platform::IPCService> ipc_;
  const std::shared_ptr<platform::SerialQueue> queue_;
  const std::shared_ptr<DaemonLink> link_;
};

}  // namespace qv::client
