#include "platform/linux/OwnedFiles.h"

#include <unistd.h>

namespace qv::platform {
namespace {

bool isOwners(const struct stat& info) { return info.st_uid == 0 || info.st_uid == ::geteuid(); }

}  // namespace

bool isWritableByOwnersOnly(const struct stat& info) {
  return isOwners(info) && (info.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

std::string whatOthersCanWrite(const std::string& path) {
  for (std::string at = path; at.starts_with('/'); at.resize(at.rfind('/'))) {
    struct stat info {};
    if (::lstat(at.c_str(), &info) != 0) return at;
    const bool isShared = S_ISDIR(info.st_mode) && (info.st_mode & S_ISVTX) != 0 && isOwners(info);
    if (!isShared && !isWritableByOwnersOnly(info)) return at;
  }
  struct stat root {};
  return ::lstat("/", &root) == 0 && isWritableByOwnersOnly(root) ? std::string() : "/";
}

}  // namespace qv::platform
