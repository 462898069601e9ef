#include "platform/linux/EntitlementStore.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/base/FileDescriptor.h"
#include "platform/linux/Json.h"
#include "platform/linux/SmallFile.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

/// Whether only root and this process's user can have written what is open here.
bool isTrustworthy(const FileDescriptor& item, mode_t type) {
  struct stat info {};
  if (::fstat(item.get(), &info) != 0) return false;
  const bool isOurs = info.st_uid == 0 || info.st_uid == ::geteuid();
  return isOurs && (info.st_mode & S_IFMT) == type && (info.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

}  // namespace

EntitlementStore::EntitlementStore(const std::string& deviceRoot)
    : directory_(deviceRoot + "/etc/quorvel/entitlements") {}

Dictionary EntitlementStore::entitlementsForBundle(const std::string& bundleIdentifier) const {
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
