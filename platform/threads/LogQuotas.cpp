#include "platform/threads/LogQuotas.h"

#include <chrono>
#include <utility>

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr double kLinesPerSecond = 20;
constexpr double kLinesAtOnce = 1000;

/// For whom this thread logs; null for the service itself.
thread_local LogQuotas::Scope* current = nullptr;

void tellOfLinesLeftOut(uid_t user, size_t count) {
  if (count > 0) QV_LOG_ERROR(logs::kPlatform, "%zu lines about user %u were left out", count, user);
}

}  // namespace

/// Who has used nothing of it is not remembered.
void LogQuotas::forgetIdle(Time now) {
  for (auto each = users_.begin(); each != users_.end();) {
    auto& [user, lines] = *each;
    if (!lines.bucket.isFull(now)) {
      ++each;
      continue;
    }
    tellOfLinesLeftOut(user, lines.leftOut);
    each = users_.erase(each);
  }
}

LogQuotas::Lines& LogQuotas::linesOf(uid_t user) {
  const Time now = std::chrono::steady_clock::now();
  if (scopes_++ == 0) forgetIdle(now);
  return users_.try_emplace(user, Lines{TokenBucket(kLinesPerSecond, kLinesAtOnce, now)}).first->second;
}

LogQuotas::Scope::Scope(LogQuotas& quotas, uid_t user)
    : quotas_(quotas), user_(user), lines_(quotas.linesOf(user)), outer_(std::exchange(current, this)) {}

LogQuotas::Scope::~Scope() {
  current = outer_;
  --quotas_.scopes_;
}

bool LogQuotas::Scope::admitsLine() { return !current || current->admits(); }

bool LogQuotas::Scope::admits() {
  const Time now = std::chrono::steady_clock::now();
  if (!lines_.bucket.hasToken(now)) {
    ++lines_.leftOut;
    return false;
  }
  lines_.bucket.take(now);
  tellOfLinesLeftOut(user_, std::exchange(lines_.leftOut, 0));
  return true;
}

}  // namespace qv::platform
