#include "platform/logind/LogindKeepAlive.h"

#include <utility>

#include "platform/logind/LogindLink.h"
#include "platform/threads/Log.h"

namespace qv::platform {

LogindKeepAlive::LogindKeepAlive(LogindKeepAliveOptions options)
    : activityHandler_(std::move(options.activityHandler)),
      link_(std::make_unique<logind::LogindLink>(std::move(options.busAddress))) {}

LogindKeepAlive::~LogindKeepAlive() { link_->stop(); }

void LogindKeepAlive::beginTransaction() {
  std::lock_guard lock(mutex_);
  if (++count_ > 1) return;
  link_->open();
  if (activityHandler_) activityHandler_(true);
}

void LogindKeepAlive::endTransaction() {
  std::lock_guard lock(mutex_);
  if (count_ == 0) {
    QV_LOG_ERROR(logs::kPlatform, "keep-alive transaction ended without one open");
    return;
  }
  if (--count_ > 0) return;
  link_->close();
  if (activityHandler_) activityHandler_(false);
}

int LogindKeepAlive::openTransactionCount() const {
  std::lock_guard lock(mutex_);
  return count_;
}

void LogindKeepAlive::setHandlers(SuspendHandlers handlers) { link_->setHandlers(std::move(handlers)); }

}  // namespace qv::platform
