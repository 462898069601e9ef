#include "support/QVTemporaryFiles.h"

#include <cmath>
#include <limits>
#include <utility>

#include "platform/Platform.h"
#include "platform/threads/Log.h"

namespace qv {
namespace {

using platform::Error;
using platform::FileSystem;
using platform::Platform;
using platform::URL;
namespace logs = platform::logs;

FileSystem& disk() { return *Platform::current().fileSystem; }

int code(const Error& error) { return static_cast<int>(error.code); }

/// Truncates toward zero; what does not fit becomes the nearest that does.
int truncated(double seconds) {
  if (std::isnan(seconds)) return 0;
  constexpr double kLowest = std::numeric_limits<int>::min();
  constexpr double kHighest = std::numeric_limits<int>::max();
  return static_cast<int>(std::fmin(std::fmax(seconds, kLowest), kHighest));
}

void reportAgeingFailure(const Error& error) {
  QV_LOG_ERROR(logs::kSupport, "error in _qvRemoveFile_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: %i",
               code(error));
  QV_CONSOLE(logs::kSupport, "error = %s", error.description().c_str());
}

/// Removes one entry if its time has come; the bytes that this freed.
int64_t ageOut(const std::string& path, double timeToLive, const RemovalRight& mayRemove) {
  const bool removeAll = timeToLive == 0.0;
  const auto attributes = disk().attributesOfItem(path);
  if (!attributes) {
    reportAgeingFailure(attributes.error());
    if (!removeAll) return 0;
  } else {
    const double now = Platform::current().clock->now().secondsSince1970;
    const double age = now - attributes.value().modificationDate.secondsSince1970;
    if (!removeAll && !(age > timeToLive)) return 0;
  }
  const std::shared_ptr<void> right = mayRemove ? mayRemove(path) : nullptr;
  if (mayRemove && !right) return 0;
  QV_LOG(logs::kSupport, "deleting old file");
  if (const auto error = disk().removeItem(path)) {
    reportAgeingFailure(*error);
    return 0;
  }
  return attributes ? static_cast<int64_t>(attributes.value().size) : 0;
}

std::optional<Error> removeIfPresent(FileSystem& fileSystem, const std::string& path) {
  return fileSystem.itemExists(path) ? fileSystem.removeItem(path) : std::nullopt;
}

void deleteFilesWithPrefix(const std::string& prefix) {
  const auto report = [](const Error& error) {
    QV_LOG_ERROR(logs::kSupport, "_qvDeleteFilesWithPrefix error: %i", code(error));
  };
  auto names = disk().contentsOfDirectory(_srTempPath());
  if (!names) {
    report(names.error());
    return;
  }
  for (const std::string& name : names.value()) {
    if (!Platform::current().localization->beginsWithFolded(name, prefix)) continue;
    if (const auto error = disk().removeItem(pathInStore(name))) report(*error);
  }
}

}  // namespace

std::string _srTempPath() { return platform::pathUnderDeviceRoot(kTempPath); }

std::string pathInStore(const std::string& name) { return _srTempPath() + name; }

void _srSetupTempDirectory() {
  QV_LOG(logs::kSupport, "_srSetupTempDirectory");
  const std::string path = _srTempPath();
  // Without its last separator: "path/" names nothing where a plain file stands at "path".
  const std::string entry = path.substr(0, path.size() - 1);
  if (disk().itemExists(entry)) return;
  if (const auto error = disk().createDirectory(entry)) {
    QV_CONSOLE(logs::kSupport, "error: %s", error->description().c_str());
    QV_LOG_ERROR(logs::kSupport, "error creating temp directory");
  }
}

int64_t _srSizeOfTempDir(std::optional<Error>* error) {
  const auto attributes = disk().attributesOfItem(_srTempPath());
  if (attributes) return static_cast<int64_t>(attributes.value().size);
  if (error != nullptr) *error = attributes.error();
  return 0;
}

int64_t _srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive, const RemovalRight& mayRemove) {
  QV_LOG(logs::kSupport, "_srDeleteFilesOlderThanTimeToLiveInSeconds: %i", truncated(timeToLive));
  auto names = disk().contentsOfDirectory(_srTempPath());
  if (!names) {
    reportAgeingFailure(names.error());
    return 0;
  }
  int64_t freed = 0;
  for (const std::string& name : names.value()) freed += ageOut(pathInStore(name), timeToLive, mayRemove);
  return freed;
}

int64_t _srDeleteAllTempFiles(const RemovalRight& mayRemove) {
  return _srDeleteFilesOlderThanTimeToLiveInSeconds(0.0, mayRemove);
}

void _srRemoveFile(const URL& file, FileCompletion completion) {
  Platform::current().backgroundQueue->post([path = file.path(), completion = std::move(completion)] {
    const auto error = removeIfPresent(disk(), path);
    if (error) QV_LOG_ERROR(logs::kSupport, "_qvRemoveFile error: %i", code(*error));
    if (completion) completion(error);
  });
}

void _srMoveFileFromURL(const URL& from, const URL& to, FileCompletion completion) {
  Platform::current().globalQueue->post(
      [source = from.path(), destination = to.path(), completion = std::move(completion)] {
        // A destination that stays in the way makes the move fail, which tells of it.
        (void)removeIfPresent(disk(), destination);
        const auto error = disk().moveItem(source, destination);
        if (error) QV_LOG_ERROR(logs::kSupport, "_qvMoveFileFromURL error: %i", code(*error));
        if (completion) completion(error);
      });
}

void _srDeleteFilesWithPrefix(const std::string& prefix) {
  Platform::current().globalQueue->post([prefix] { deleteFilesWithPrefix(prefix); });
}

std::optional<platform::Date> _srGetCreationDateForFile(const URL& file) {
  const auto attributes = disk().attributesOfItem(file.path());
  return attributes ? std::optional(attributes.value().creationDate) : std::nullopt;
}

}  // namespace qv
