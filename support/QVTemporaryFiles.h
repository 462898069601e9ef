#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/Platform.h"
#include "platform/base/Error.h"
#include "platform/base/Value.h"

namespace qv {

/// The store's directory, without the device root; ends with "/".
inline constexpr const char kTempPath[] = "/private/var/mobile/Library/Quorvel/";

/// Takes what went wrong, or nothing.
using FileCompletion = std::function<void(const std::optional<platform::Error>&)>;

/// Asked with an entry's path right before the entry would be removed. Nothing leaves the entry alone; anything else is
/// held until its removal is over.
using RemovalRight = std::function<std::shared_ptr<void>(const std::string& path)>;

/// The temporary file store: one private directory, in which every movie is written before it is
/// handed on, and from which it is removed when it has been handed on or has grown old. The store
/// has no index; its producers name its files. An entry's age is the time since its last
/// modification.
///
/// A value: copies work on the same directory. The platform is borrowed and must outlive them, and the work that they
/// have queued.
///
/// Threading: thread-safe. Operations without a completion work in the caller's thread; nothing holds a
/// lock, and two asynchronous ones may run at once and in any order, so whoever needs an order
/// goes on from a completion.
class QVTemporaryFiles {
 public:
  explicit QVTemporaryFiles(const platform::Platform& platform) : platform_(&platform) {}

  /// The store's directory, under the device root; ends with "/".
  [[nodiscard]] std::string _srTempPath() const;
  /// The path of the entry of this name.
  [[nodiscard]] std::string pathInStore(const std::string& name) const { return _srTempPath() + name; }
  [[nodiscard]] platform::FileSystem& disk() const { return *platform_->fileSystem; }
  /// Whether there is a file of more than no bytes at this path, now.
  [[nodiscard]] bool isMovieAt(const std::string& path) const;
  /// Makes the directory unless something stands there. Its parents are made by the packaging. A
  /// failure is logged, and the daemon goes on without the directory. A directory that others could read until now, as
  /// former versions made it, is closed to them with all that is in it.
  void _srSetupTempDirectory() const;
  /// Makes the directory again where it has gone, and tells what keeps movies from being made in it.
  [[nodiscard]] std::optional<platform::Error> prepareForMovies() const;
  /// The size in bytes of the directory's own entry, not of the files in it; 0 where it cannot be
  /// read, with the reason in `error` (may be null; left alone on success).
  int64_t _srSizeOfTempDir(std::optional<platform::Error>* error) const;

  /// Removes every entry that is strictly older than `timeToLive` seconds, or every entry at all when
  /// that is exactly 0, and returns the sizes of those removed, in bytes. An entry whose age cannot
  /// be read stays unless all must go, and so does one for which there is no right (every entry may go where
  /// `mayRemove` is empty). Failures are logged and the walk goes on.
  int64_t _srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive, const RemovalRight& mayRemove = {}) const;
  int64_t _srDeleteAllTempFiles(const RemovalRight& mayRemove = {}) const;

  /// Removes one file later on, on the background queue, where `completion` (may be empty) is
  /// called. It is no failure that nothing is there.
  void _srRemoveFile(const platform::URL& file, FileCompletion completion) const;
  /// Calls the completion (may be empty) on the background queue, with nothing done.
  void answerInBackground(FileCompletion completion, std::optional<platform::Error> error) const;
  /// Offered, not called by this daemon: moves one file later on, on the global queue, in place of whatever is at the
  /// destination; `completion` (may be empty) is called there.
  void _srMoveFileFromURL(const platform::URL& from, const platform::URL& to, FileCompletion completion) const;
  /// Offered, not called by this daemon: removes later on, on the global queue, every entry of the store whose name
  /// begins with `prefix`, without regard to case and diacritics.
  void _srDeleteFilesWithPrefix(const std::string& prefix) const;

  /// Offered, not called by this daemon. Nothing where the attributes cannot be read.
  [[nodiscard]] std::optional<platform::Date> _srGetCreationDateForFile(const platform::URL& file) const;

 private:
  void closeToOthers() const;
  /// Removes one entry if its time has come; the bytes that this freed.
  [[nodiscard]] int64_t ageOut(const std::string& path, double timeToLive, const RemovalRight& mayRemove) const;
  void deleteFilesWithPrefix(const std::string& prefix) const;

  const platform::Platform* platform_;
};

}  // namespace qv
