#include "support/QVTemporaryFiles.h"

#include <cmath>
#include <limits>
#include <utility>

#include "platform/threads/Log.h"

namespace qv {
namespace {

using platform::Error;
using platform::FileSystem;
using platform::URL;
namespace logs = platform::logs;

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

std::optional<Error> removeIfPresent(FileSystem& fileSystem, const std::string& path) {
  return fileSystem.itemExists(path) ? fileSystem.removeItem(path) : std::nullopt;
}

}  // namespace

std::string QVTemporaryFiles::_srTempPath() const { return platform_->deviceRoot + kTempPath; }

bool QVTemporaryFiles::isMovieAt(const std::string& path) const {
  const auto attributes = disk().attributesOfItem(path);
  return attributes && !attributes.value().isDirectory && attributes.value().size > 0;
}

void QVTemporaryFiles::closeToOthers() const {
  const auto report = [](const std::optional<Error>& error) {
    if (error) QV_LOG_ERROR(logs::kSupport, "others can read the store: %s", error->description().c_str());
  };
  const auto names = disk().contentsOfDirectory(_srTempPath());
  if (!names) return;
  report(disk().makePrivate(pathInStore(".")));
  for (const std::string& name : names.value()) report(disk().makePrivate(pathInStore(name)));
}

void QVTemporaryFiles::_srSetupTempDirectory() const {
  QV_LOG(logs::kSupport, "_srSetupTempDirectory");
  const std::string path = _srTempPath();
  // Without its last separator: "path/" names nothing where a plain file stands at "path".
  const std::string entry = path.substr(0, path.size() - 1);
  if (disk().itemExists(entry)) return closeToOthers();
  if (const auto error = disk().createDirectory(entry)) {
    QV_CONSOLE(logs::kSupport, "error: %s", error->description().c_str());
    QV_LOG_ERROR(logs::kSupport, "error creating temp directory");
  }
}

std::optional<Error> QVTemporaryFiles::prepareForMovies() const {
  const std::string path = _srTempPath();
  if (!disk().itemExists(path.substr(0, path.size() - 1))) _srSetupTempDirectory();
  return disk().checkWritable(path);
}

int64_t QVTemporaryFiles::_srSizeOfTempDir(std::optional<Error>* error) const {
  const auto attributes = disk().attributesOfItem(_srTempPath());
  if (attributes) return static_cast<int64_t>(attributes.value().size);
  if (error != nullptr) *error = attributes.error();
  return 0;
}

int64_t QVTemporaryFiles::ageOut(const std::string& path, double timeToLive, const RemovalRight& mayRemove) const {
  const bool removeAll = timeToLive == 0.0;
  const auto attributes = disk().attributesOfItem(path);
  if (!attributes) {
    reportAgeingFailure(attributes.error());
    if (!removeAll) return 0;
  } else {
    const double now = platform_->clock->now().secondsSince1970;
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

int64_t QVTemporaryFiles::_srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive,
                                                                     const RemovalRight& mayRemove) const {
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

int64_t QVTemporaryFiles::_srDeleteAllTempFiles(const RemovalRight& mayRemove) const {
  return _srDeleteFilesOlderThanTimeToLiveInSeconds(0.0, mayRemove);
}

void QVTemporaryFiles::_srRemoveFile(const URL& file, FileCompletion completion) const {
  platform_->backgroundQueue->post([&disk = disk(), path = file.path(), completion = std::move(completion)] {
    const auto error = removeIfPresent(disk, path);
    if (error) QV_LOG_ERROR(logs::kSupport, "_qvRemoveFile error: %i", code(*error));
    if (completion) completion(error);
  });
}

void QVTemporaryFiles::answerInBackground(FileCompletion completion, std::optional<Error> error) const {
  if (!completion) return;
  platform_->backgroundQueue->post(
      [completion = std::move(completion), error = std::move(error)] { completion(error); });
}

void QVTemporaryFiles::_srMoveFileFromURL(const URL& from, const URL& to, FileCompletion completion) const {
  platform_->globalQueue->post(
      [&disk = disk(), source = from.path(), destination = to.path(), completion = std::move(completion)] {
        // A destination that stays in the way makes the move fail, which tells of it.
        (void)removeIfPresent(disk, destination);
        const auto error = disk.moveItem(source, destination);
        if (error) QV_LOG_ERROR(logs::kSupport, "_qvMoveFileFromURL error: %i", code(*error));
        if (completion) completion(error);
      });
}

void QVTemporaryFiles::deleteFilesWithPrefix(const std::string& prefix) const {
  const auto report = [](const Error& error) {
    QV_LOG_ERROR(logs::kSupport, "_qvDeleteFilesWithPrefix error: %i", code(error));
  };
  auto names = disk().contentsOfDirectory(_srTempPath());
  if (!names) {
    report(names.error());
    return;
  }
  for (const std::string& name : names.value()) {
    if (!platform_->localization->beginsWithFolded(name, prefix)) continue;
    if (const auto error = disk().removeItem(pathInStore(name))) report(*error);
  }
}

void QVTemporaryFiles::_srDeleteFilesWithPrefix(const std::string& prefix) const {
  platform_->globalQueue->post([self = *this, prefix] { self.deleteFilesWithPrefix(prefix); });
}

std::optional<platform::Date> QVTemporaryFiles::_srGetCreationDateForFile(const URL& file) const {
  const auto attributes = disk().attributesOfItem(file.path());
  return attributes ? std::optional(attributes.value().creationDate) : std::nullopt;
}

}  // namespace qv
