#pragma once

#include <chrono>
#include <cstdint>
#include <optional>

#include "platform/base/Result.h"
#include "support/QVTemporaryFiles.h"

/// How much room the disk of the temporary store must have for what. One policy: whoever starts a recording asks here,
/// and whoever watches the disk while one runs is given these figures.
///
/// When the free space falls below a threshold, space is asked for with the threshold's urgency, 1 to 3. Bytes,
/// decimal.
namespace qv {

/// A recording starts only with more than this.
inline constexpr uint64_t kMinimumFreeSpaceForRecording = 100'000'000;
/// With less a movie recording ends: there is room for what its file still has to take (32 MiB may wait for a slow
/// disk, and the index of an hour has 4 MB), and for the rest of the device.
inline constexpr uint64_t kMinimumFreeSpaceWhileRecording = 50'000'000;
/// With less, the rest is for the system.
inline constexpr uint64_t kCriticalFreeSpace = 16'000'000;

/// Below the first threshold: nothing starts any more.
inline constexpr int32_t kUrgencyNothingStarts = 1;
/// Below the second, or for a short time below the third: movie recordings end and keep their movies.
inline constexpr int32_t kUrgencyEndsRecordings = 2;
/// Below the third: whatever records ends, and all movies go that nobody is making or saving.
inline constexpr int32_t kUrgencyRemovesMovies = 3;
/// While something is recorded, the space must be critical for so long before urgency 3, so that a recording which ends
/// by urgency 2 can keep its movie.
inline constexpr std::chrono::seconds kCriticalFor{5};

/// Whether this is what a write without room fails with, that of a quota's included, whose disk may have room.
[[nodiscard]] bool isLackOfSpace(const std::optional<platform::Error>& failure);

/// How much room there is, on the disk of the temporary store.
///
/// Threading: thread-safe; looks at the disk in the caller's thread.
class QVDiskSpace {
 public:
  explicit QVDiskSpace(const QVTemporaryFiles& files) : files_(files) {}

  /// Bytes free on the file system that holds the store; 0 where that cannot be read.
  [[nodiscard]] uint64_t _srDeviceFreeDiskSpace() const;
  [[nodiscard]] bool _srDeviceHasSufficientFreeSpaceForRecording() const;
  /// True also where the free space cannot be read: a recording is not given up for that.
  [[nodiscard]] bool _srDeviceHasSufficientFreeSpaceToContinueRecording() const;

 private:
  [[nodiscard]] platform::Result<uint64_t> freeBytes() const;

  const QVTemporaryFiles files_;
};

}  // namespace qv
