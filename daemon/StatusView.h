#pragma once

#include <sys/types.h>

#include <string>

#include "daemon/Caller.h"

namespace qv {

/// What somebody may see of the daemon: root and the daemon's own user see all, others what is their own. That the
/// screen is recorded, how and since when, is no secret, as it is none to whoever stands before it.
///
/// Threading: a value.
class StatusView {
 public:
  explicit StatusView(const Caller& caller);
  [[nodiscard]] bool seesAll() const { return seesAll_; }
  [[nodiscard]] bool sees(uid_t user) const { return seesAll_ || user == user_; }
  /// What is kept under an owner (applicationOwner); nobody's only where all is seen.
  [[nodiscard]] bool seesOwner(const std::string& owner) const;
  [[nodiscard]] uid_t user() const { return user_; }

 private:
  const uid_t user_;
  const bool seesAll_;
};

}  // namespace qv
