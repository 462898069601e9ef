#include "platform/sdbus/UserQuotas.h"

#include <algorithm>
#include <utility>

namespace qv::platform::sdbus {
namespace {

constexpr uid_t kRoot = 0;
constexpr size_t kManyUsers = 64;
constexpr std::chrono::milliseconds kShortestPause{50};

}  // namespace

UserQuota::UserQuota(uid_t user, const IPCQuotas& bounds, Time now)
    : user_(user),
      bounds_(bounds),
      arrivals_(bounds.connectionsPerSecond, static_cast<double>(bounds.connections), now),
      calls_(bounds.callsPerSecond, bounds.callsAtOnce, now) {}

bool UserQuota::addConnection(Time now) {
  std::lock_guard lock(mutex_);
  if (user_ != kRoot) {
    if (connections_ >= bounds_.connections || !arrivals_.hasToken(now)) return false;
    arrivals_.take(now);
  }
  ++connections_;
  return true;
}

void UserQuota::removeConnection() {
  std::lock_guard lock(mutex_);
  --connections_;
}

bool UserQuota::changeUnfinished(size_t before, size_t now) {
  std::lock_guard lock(mutex_);
  const size_t others = unfinishedBytes_ - before;
  if (now > before && others + now > bounds_.unfinishedBytes) return false;
  unfinishedBytes_ = others + now;
  return true;
}

bool UserQuota::mayCall(Time now) {
  std::lock_guard lock(mutex_);
  return calls_.hasToken(now);
}

void UserQuota::countCall(Time now) {
  std::lock_guard lock(mutex_);
  calls_.take(now);
}

std::chrono::milliseconds UserQuota::pause(Time now) {
  std::lock_guard lock(mutex_);
  return std::max(kShortestPause, calls_.untilToken(now));
}

bool UserQuota::isIdle(Time now) {
  std::lock_guard lock(mutex_);
  return connections_ == 0 && unfinishedBytes_ == 0 && arrivals_.isFull(now) && calls_.isFull(now);
}

std::unique_ptr<QuotaShare> QuotaShare::take(std::shared_ptr<UserQuota> quota, Kind kind, UserQuota::Time now) {
  if (kind == Kind::Connection && !quota->addConnection(now)) return nullptr;
  return std::unique_ptr<QuotaShare>(new QuotaShare(std::move(quota), kind));
}

QuotaShare::~QuotaShare() {
  (void)quota_->changeUnfinished(bytes_, 0);
  if (kind_ == Kind::Connection) quota_->removeConnection();
}

bool QuotaShare::holdBytes(size_t bytes) {
  if (bytes == bytes_) return true;
  if (!quota_->changeUnfinished(bytes_, bytes)) return false;
  bytes_ = bytes;
  return true;
}

std::shared_ptr<UserQuota> UserQuotas::of(uid_t user, UserQuota::Time now) {
  std::lock_guard lock(mutex_);
  if (quotas_.size() >= kManyUsers) forgetIdle(now);
  auto& quota = quotas_[user];
  if (!quota) quota = std::make_shared<UserQuota>(user, bounds_, now);
  return quota;
}

void UserQuotas::forgetIdle(UserQuota::Time now) {
  std::erase_if(quotas_,
                [now](const auto& entry) { return entry.second.use_count() == 1 && entry.second->isIdle(now); });
}

}  // namespace qv::platform::sdbus
