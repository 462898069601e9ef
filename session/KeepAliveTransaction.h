#pragma once

#include "platform/IPC.h"
#include "platform/KeepAlive.h"

namespace qv {

/// One keep-alive transaction: open as long as this lives.
///
/// Threading: thread-safe.
class KeepAliveTransaction {
 public:
  explicit KeepAliveTransaction(platform::KeepAliveService& service) : service_(service) {
    service_.beginTransaction();
  }
  ~KeepAliveTransaction() { service_.endTransaction(); }
  KeepAliveTransaction(const KeepAliveTransaction&) = delete;
  KeepAliveTransaction& operator=(const KeepAliveTransaction&) = delete;

 private:
  platform::KeepAliveService& service_;
};

}  // namespace qv
