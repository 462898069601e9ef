#pragma once

#include <sys/types.h>

#include <chrono>
#include <map>
#include <memory>
#include <mutex>

#include "platform/base/TokenBucket.h"
#include "platform/sdbus/SdBusIPC.h"

namespace qv::platform::sdbus {

/// What all peers of one user have taken of this service, and may take.
///
/// Threading: thread-safe.
class UserQuota {
 public:
  using Time = TokenBucket::Time;
  UserQuota(uid_t user, const IPCQuotas& bounds, Time now);

  [[nodiscard]] uid_t user() const { return user_; }
  /// Counts a connection, where there may be one more and they do not come too fast. Root is not bounded: it could do
  /// worse, and the device's own programs may run as root.
  [[nodiscard]] bool addConnection(Time now);
  void removeConnection();
  /// Counts `now` bytes in place of `before`; false where that is too much.
  [[nodiscard]] bool changeUnfinished(size_t before, size_t now);

  [[nodiscard]] bool mayCall(Time now);
  void countCall(Time now);
  /// How long reading is to pause once `mayCall` is false. Not so short that a wake-up brings one call only.
  [[nodiscard]] std::chrono::milliseconds pause(Time now);

  /// Nothing would be forgotten with this.
  [[nodiscard]] bool isIdle(Time now);

 private:
  const uid_t user_;
  const IPCQuotas bounds_;
  std::mutex mutex_;
  // Guarded by mutex_:
  size_t connections_ = 0;
  size_t unfinishedBytes_ = 0;
  TokenBucket arrivals_;
  TokenBucket calls_;
};

/// One connection's part of its user's quota, given back when this goes.
///
/// Threading: used by one thread at a time.
class QuotaShare {
 public:
  enum class Kind {
    Connection,  ///< counted, and to be admitted
    Bytes        ///< of a connection that this process has made
  };
  /// Null where the user has no room for it.
  [[nodiscard]] static std::unique_ptr<QuotaShare> take(std::shared_ptr<UserQuota> quota, Kind kind,
                                                        UserQuota::Time now);
  ~QuotaShare();
  QuotaShare(const QuotaShare&) = delete;
  QuotaShare& operator=(const QuotaShare&) = delete;

  [[nodiscard]] UserQuota& quota() { return *quota_; }
  /// Holds so many bytes from now on; false where the user's connections hold too many together.
  [[nodiscard]] bool holdBytes(size_t bytes);

 private:
  QuotaShare(std::shared_ptr<UserQuota> quota, Kind kind) : quota_(std::move(quota)), kind_(kind) {}

  const std::shared_ptr<UserQuota> quota_;
  const Kind kind_;
  size_t bytes_ = 0;
};

/// The quotas of all users. A user's outlives its connections for as long as it remembers something.
///
/// Threading: thread-safe.
class UserQuotas {
 public:
  explicit UserQuotas(const IPCQuotas& bounds) : bounds_(bounds) {}
  [[nodiscard]] std::shared_ptr<UserQuota> of(uid_t user, UserQuota::Time now);

 private:
  void forgetIdle(UserQuota::Time now);

  const IPCQuotas bounds_;
  std::mutex mutex_;
  std::map<uid_t, std::shared_ptr<UserQuota>> quotas_;
};

}  // namespace qv::platform::sdbus
