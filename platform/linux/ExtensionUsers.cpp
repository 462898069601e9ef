#include "platform/linux/ExtensionUsers.h"

#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/linux/Json.h"
#include "platform/linux/SmallFile.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

/// No identifier begins with a dot.
constexpr const char kFile[] = "/.users.json";

}  // namespace

UserRange reservedUserRange() { return {QV_EXTENSION_FIRST_USER, QV_EXTENSION_USER_COUNT}; }

ExtensionUsers::ExtensionUsers(std::string containers, UserRange range)
    : containers_(std::move(containers)), range_(range) {}

Result<uid_t> ExtensionUsers::userOf(const std::string& extension) {
  const std::lock_guard lock(mutex_);
  if (!std::exchange(isLoaded_, true)) load();
  askedFor_.insert(extension);
  const auto known = users_.find(extension);
  return known != users_.end() ? Result<uid_t>(known->second) : assign(extension);
}

void ExtensionUsers::load() {
  addFromFile();
  addOwnersOfContainers();
}

void ExtensionUsers::addFromFile() {
  const auto file = readJSONDictionary(containers_ + kFile);
  if (!file) {
    if (file.error().code == ENOENT) return;
    QV_LOG_ERROR(logs::kExtensions, "the users of extensions are taken from their containers: %s",
                 file.error().description().c_str());
    return;
  }
  for (const auto& [extension, user] : file.value()) {
    if (const auto* number = user.getIf<int64_t>(); number != nullptr && *number > 0) {
      add(extension, static_cast<uid_t>(*number));
    }
  }
}

void ExtensionUsers::addOwnersOfContainers() {
  std::error_code failure;
  for (const auto& entry : std::filesystem::directory_iterator(containers_, failure)) {
    struct stat info {};
    if (::lstat(entry.path().c_str(), &info) == 0 && S_ISDIR(info.st_mode)) add(entry.path().filename(), info.st_uid);
  }
}

/// What was known first stays.
void ExtensionUsers::add(const std::string& extension, uid_t user) {
  const bool isInRange = user >= range_.first && user - range_.first < range_.count;
  if (!isInRange || users_.count(extension) != 0 || !taken_.insert(user).second) return;
  users_[extension] = user;
}

Result<uid_t> ExtensionUsers::assign(const std::string& extension) {
  if (users_.size() >= range_.count) forgetWithoutContainers();
  if (users_.size() >= range_.count) return Error::posix(ENOSPC, "a user for extension " + extension);
  uid_t user = range_.first;
  while (taken_.count(user) != 0) ++user;
  add(extension, user);
  if (auto failure = save()) {
    users_.erase(extension);
    taken_.erase(user);
    return *failure;
  }
  return user;
}

void ExtensionUsers::forgetWithoutContainers() {
  std::erase_if(users_, [&](const auto& entry) {
    std::error_code failure;
    const auto status = std::filesystem::symlink_status(containers_ + "/" + entry.first, failure);
    const bool isGone = status.type() == std::filesystem::file_type::not_found && askedFor_.count(entry.first) == 0;
    if (isGone) taken_.erase(entry.second);
    return isGone;
  });
}

std::optional<Error> ExtensionUsers::save() const {
  Dictionary all;
  for (const auto& [extension, user] : users_) all[extension] = Value(int64_t{user});
  return replaceSmallFile(containers_ + kFile, serializeJSON(Value(std::move(all))));
}

}  // namespace qv::platform
