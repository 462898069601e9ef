#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "platform/Error.h"
#include "platform/Value.h"

/// The temporary file store: one private directory, in which every movie is written before it is
/// handed on, and from which it is removed when it has been handed on or has grown old. The store
/// has no index; its producers name its files. An entry's age is the time since its last
/// modification.
///
/// The functions work on the installed platform's disk, clock and queues.
///
/// Threading: thread-safe. Those without a completion work in the caller's thread; nothing holds a
/// lock, and two asynchronous ones may run at once and in any order, so whoever needs an order
/// goes on from a completion.
namespace qv {

/// Takes what went wrong, or nothing.
using FileCompletion = std::function<void(const std::optional<platform::Error>&)>;

/// A recording starts only with more free bytes than this (decimal).
inline constexpr uint64_t kMinimumFreeSpaceForRecording = 100'000'000;
/// A movie recording ends when fewer bytes than this are free (decimal): room for what its file still has to take
/// (32 MiB may wait for a slow disk, and the index of an hour has 4 MB), and for the rest of the device.
inline constexpr uint64_t kMinimumFreeSpaceWhileRecording = 50'000'000;

/// The store's directory, under the device root; ends with "/".
[[nodiscard]] std::string _srTempPath();
/// Makes the directory unless something stands there. Its parents are made by the packaging. A
/// failure is logged, and the daemon goes on without the directory.
void _srSetupTempDirectory();
/// The size in bytes of the directory's own entry, not of the files in it; 0 where it cannot be
/// read, with the reason in `error` (may be null; left alone on success).
int64_t _srSizeOfTempDir(std::optional<platform::Error>* error);

/// Removes every entry that is strictly older than `timeToLive` seconds, or every entry at all when
/// that is exactly 0, and returns the sizes of those removed, in bytes. An entry whose age cannot
/// be read stays unless all must go. Failures are logged and the walk goes on.
int64_t _srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive);
int64_t _srDeleteAllTempFiles();

/// Removes one file later on, on the background queue, where `completion` (may be empty) is
/// called. It is no failure that nothing is there.
void _srRemoveFile(const platform::URL& file, FileCompletion completion);
/// Moves one file later on, on the global queue, in place of whatever is at the destination;
/// `completion` (may be empty) is called there.
void _srMoveFileFromURL(const platform::URL& from, const platform::URL& to, FileCompletion completion);
/// Removes later on, on the global queue, every entry of the store whose name begins with `prefix`,
/// without regard to case and diacritics.
void _srDeleteFilesWithPrefix(const std::string& prefix);

/// Nothing where the attributes cannot be read.
[[nodiscard]] std::optional<platform::Date> _srGetCreationDateForFile(const platform::URL& file);
/// Bytes free on the file system that holds the store; 0 where that cannot be read.
[[nodiscard]] uint64_t _srDeviceFreeDiskSpace();
[[nodiscard]] bool _srDeviceHasSufficientFreeSpaceForRecording();
/// True also where the free space cannot be read: a recording is not given up for that.
[[nodiscard]] bool _srDeviceHasSufficientFreeSpaceToContinueRecording();

}  // namespace qv
