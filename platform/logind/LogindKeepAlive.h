#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "platform/IPC.h"
#include "platform/KeepAlive.h"
#include "platform/SuspendMonitor.h"

namespace qv::platform {

namespace logind {
class LogindLink;
}

/// What keep-alive transactions do beside logind.
struct LogindKeepAliveOptions {
  /// The bus on which logind is; empty: the system bus.
  std::string busAddress;
  /// Told when the first transaction opens (true) and the last one closes (false), in the thread that did
  /// it; must not call back.
  std::function<void(bool isOpen)> activityHandler;
};

/// Counts keep-alive transactions, and while there are any holds two inhibitors of systemd-logind: the
/// device does not idle to sleep, and a sleep that somebody asks for waits until the recordings know.
///
/// The service manager starts the daemon and never stops an idle one, so nothing else is to be kept.
/// The bus is connected with the first transaction and left with the last: an idle daemon is not on it.
/// Where there is no bus or no logind, transactions are counted all the same, and one Info line tells.
/// When the bus goes away, the inhibitors last; sleep is not announced until the next first transaction.
///
/// Threading: thread-safe. Neither operation waits for the bus. Suspend handlers run on a thread that
/// begins with the first transaction, and end with this object.
class LogindKeepAlive final : public KeepAliveService, public SuspendMonitor {
 public:
  explicit LogindKeepAlive(LogindKeepAliveOptions options = {});
  ~LogindKeepAlive() override;

  void beginTransaction() override;
  void endTransaction() override;
  [[nodiscard]] int openTransactionCount() const;
  void setHandlers(SuspendHandlers handlers) override;

 private:
  const std::function<void(bool)> activityHandler_;
  const std::unique_ptr<logind::LogindLink> link_;
  mutable std::mutex mutex_;
  int count_ = 0;
};

}  // namespace qv::platform
