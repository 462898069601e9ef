#pragma once

#include <mutex>

#include "platform/IPC.h"

namespace qv::platform {

/// Counts keep-alive transactions. The service manager starts the daemon and never stops an idle
/// one, so the count is all there is to keep.
///
/// Threading: thread-safe.
class SdBusKeepAlive final : public KeepAliveService {
 public:
  void beginTransaction() override;
  void endTransaction() override;
  [[nodiscard]] int openTransactionCount() const override;

 private:
  mutable std::mutex mutex_;
  int count_ = 0;
};

}  // namespace qv::platform
