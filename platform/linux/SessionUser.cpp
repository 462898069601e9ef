#include "platform/linux/SessionUser.h"

#include <pwd.h>
#include <unistd.h>

#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <memory>

#include "platform/threads/Log.h"

namespace qv::platform {

std::optional<uid_t> userNamed(const std::string& name) {
  uid_t number = 0;
  const char* const end = name.data() + name.size();
  if (const auto read = std::from_chars(name.data(), end, number); read.ec == std::errc() && read.ptr == end) {
    return number == static_cast<uid_t>(-1) ? std::nullopt : std::optional(number);
  }
  const std::unique_ptr<FILE, int (*)(FILE*)> accounts(std::fopen("/etc/passwd", "re"), std::fclose);
  if (!accounts) return std::nullopt;
  passwd account{};
  passwd* found = nullptr;
  char texts[4096];
  while (::fgetpwent_r(accounts.get(), &account, texts, sizeof texts, &found) == 0) {
    if (name == account.pw_name) return account.pw_uid;
  }
  return std::nullopt;
}

uid_t sessionUserFromEnvironment() {
  const char* const name = std::getenv("QUORVEL_SESSION_USER");
  if (::geteuid() != 0 || name == nullptr || *name == '\0') return ::geteuid();
  if (const auto user = userNamed(name)) return *user;
  QV_LOG_ERROR(logs::kPlatform, "QUORVEL_SESSION_USER: there is no user %s", name);
  return 0;
}

}  // namespace qv::platform
