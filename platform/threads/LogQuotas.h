#pragma once

#include <sys/types.h>

#include <cstddef>
#include <map>

#include "platform/base/TokenBucket.h"

namespace qv::platform {

/// What the users of a service may have logged: of each a thousand lines at once, and twenty a second for long. So
/// nobody fills the device's log, or hides in it what he does; what is left out is counted in a line of its own.
///
/// Threading: one thread at a time.
class LogQuotas {
 private:
  struct Lines {
    TokenBucket bucket;
    size_t leftOut = 0;
  };

 public:
  /// While it lives, what its thread logs is logged for one user.
  ///
  /// Threading: made and destroyed by one thread.
  class Scope {
   public:
    Scope(LogQuotas& quotas, uid_t user);
    ~Scope();
    Scope(const Scope&) = delete;
    Scope& operator=(const Scope&) = delete;

    /// Whether this thread may log one line now.
    [[nodiscard]] static bool admitsLine();

   private:
    [[nodiscard]] bool admits();

    LogQuotas& quotas_;
    const uid_t user_;
    Lines& lines_;
    Scope* const outer_;
  };

 private:
  using Time = TokenBucket::Time;
  void forgetIdle(Time now);
  [[nodiscard]] Lines& linesOf(uid_t user);

  std::map<uid_t, Lines> users_;
  size_t scopes_ = 0;  ///< whose lines must stay
};

}  // namespace qv::platform
