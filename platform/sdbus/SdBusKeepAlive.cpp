#include "platform/sdbus/SdBusKeepAlive.h"

#include "platform/Log.h"

namespace qv::platform {

void SdBusKeepAlive::beginTransaction() {
  std::lock_guard lock(mutex_);
  ++count_;
}

void SdBusKeepAlive::endTransaction() {
  std::lock_guard lock(mutex_);
  if (count_ > 0) {
    --count_;
  } else {
    QV_LOG_ERROR(logs::kPlatform, "keep-alive transaction ended without one open");
  }
}

int SdBusKeepAlive::openTransactionCount() const {
  std::lock_guard lock(mutex_);
  return count_;
}

}  // namespace qv::platform
