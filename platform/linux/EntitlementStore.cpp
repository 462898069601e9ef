#include "platform/linux/EntitlementStore.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <optional>

#include "platform/base/FileDescriptor.h"
#include "platform/linux/Json.h"
#include "platform/linux/OwnedFiles.h"
#include "platform/linux/SessionUser.h"
#include "platform/linux/SmallFile.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

/// Whether only root and this process's user can have written what is open here.
bool isTrustworthy(const FileDescriptor& item, mode_t type) {
  struct stat info {};
  if (::fstat(item.get(), &info) != 0) return false;
  return (info.st_mode & S_IFMT) == type && isWritableByOwnersOnly(info);
}

constexpr const char kUsers[] = "users";
constexpr const char kSessionUser[] = "session";

/// An entry of the list of users.
std::optional<uid_t> userOf(const Value& entry, uid_t sessionUser) {
  if (const auto* name = entry.getIf<std::string>()) {
    return *name == kSessionUser ? std::optional(sessionUser) : userNamed(*name);
  }
  if (const auto* number = entry.getIf<int64_t>()) return userNamed(std::to_string(*number));
  return std::nullopt;
}

}  // namespace

EntitlementStore::EntitlementStore(const std::string& deviceRoot, uid_t sessionUser)
    : directory_(deviceRoot + "/etc/quorvel/entitlements"), sessionUser_(sessionUser) {}

Dictionary EntitlementStore::entitlementsForBundle(const std::string& bundleIdentifier, uid_t user) const {
  Dictionary entitlements = read(bundleIdentifier);
  if (entitlements.empty()) return {};
  if (!isFor(user, entitlements, bundleIdentifier)) {
    QV_LOG(logs::kPlatform, "entitlements of %s do not hold for user %u", bundleIdentifier.c_str(), user);
    return {};
  }
  entitlements.erase(kUsers);
  return entitlements;
}

bool EntitlementStore::isFor(uid_t user, const Dictionary& file, const std::string& bundleIdentifier) const {
  const Value* const listed = find(file, kUsers);
  if (listed == nullptr) return user == 0 || user == sessionUser_;
  if (listed->getIf<Array>() == nullptr) {
    QV_LOG_ERROR(logs::kPlatform, "entitlements of %s are ignored: \"users\" is no array", bundleIdentifier.c_str());
    return false;
  }
  bool isListed = false;
  for (const Value& entry : listed->asArray()) {
    const auto found = userOf(entry, sessionUser_);
    if (!found) {
      QV_LOG_ERROR(logs::kPlatform, "entitlements of %s name a user who is nobody: %s", bundleIdentifier.c_str(),
                   serializeJSON(entry).c_str());
    }
    isListed = isListed || found == user;
  }
  return isListed;
}

Dictionary EntitlementStore::read(const std::string& bundleIdentifier) const {
  if (!isSafeFileStem(bundleIdentifier)) return {};
  const FileDescriptor directory(::open(directory_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory.isValid()) return {};
  const std::string name = bundleIdentifier + ".json";
  const FileDescriptor file(
      ::openat(directory.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
  if (!file.isValid() && errno == ENOENT) return {};
  if (!file.isValid() || !isTrustworthy(directory, S_IFDIR) || !isTrustworthy(file, S_IFREG)) {
    QV_LOG_ERROR(logs::kPlatform, "entitlements of %s are ignored: others than root could have written them",
                 bundleIdentifier.c_str());
    return {};
  }
  const auto content = readSmallFile(file);
  const auto value = content ? parseJSON(content.value()) : Result<Value>(content.error());
  if (value && value.value().getIf<Dictionary>() != nullptr) return value.value().asDictionary();
  QV_LOG_ERROR(logs::kPlatform, "entitlements of %s are ignored: %s", bundleIdentifier.c_str(),
               value ? "not a dictionary" : value.error().description().c_str());
  return {};
}

}  // namespace qv::platform
