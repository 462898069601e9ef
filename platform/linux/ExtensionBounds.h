#pragma once

#include <sys/resource.h>

#include <chrono>
#include <cstddef>
#include <cstdint>

/// What an extension may take of the device. docs/broadcast-extensions.md tells authors the same figures.
namespace qv::platform::extensionbounds {

// Of one process, by its limits. Beyond them its own calls fail.

inline constexpr rlim_t kOpenFiles = 1024;
/// Bytes of one file. The signal that goes with it is ignored, so that the write says EFBIG.
inline constexpr rlim_t kFileSize = rlim_t{256} << 20;
/// Bytes. Room for any upload; a stop for one that allocates without end.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr rlim_t kAddressSpace = RLIM_INFINITY;  // the sanitizers reserve terabytes
#else
inline constexpr rlim_t kAddressSpace = sizeof(void*) == 8 ? rlim_t{4} << 30 : RLIM_INFINITY;
#endif
inline constexpr rlim_t kLockedMemory = rlim_t{8} << 20;  // bytes
/// Of all processes of one extension, and only where it has a user of its own: the kernel counts by user.
inline constexpr rlim_t kThreads = 512;
/// When memory runs out, extensions go before the recording does; the scale ends at 1000.
inline constexpr int kOutOfMemoryScore = 500;

// Of one process, by its cgroup, where one is delegated to whoever starts it.

inline constexpr uint64_t kCgroupMemory = uint64_t{1} << 30;  // bytes
inline constexpr uint64_t kCgroupTasks = 256;
inline constexpr uint64_t kCgroupProcessorWeight = 50;  // of 100 that the daemon has
/// Of a hundred of all processors.
inline constexpr uint64_t kCgroupProcessorPercent = 75;

// Of its container. Beyond them its process is killed.

inline constexpr uint64_t kContainerBytes = uint64_t{512} << 20;
inline constexpr uint64_t kContainerEntries = 65536;  // files and directories
inline constexpr int kContainerDepth = 64;            // directories
/// Between two counts; longer where counting takes long.
inline constexpr std::chrono::seconds kContainerCountInterval{2};

/// Bytes of stderr.log, of which the younger half is kept when it is full.
inline constexpr size_t kLogSize = size_t{1} << 20;

}  // namespace qv::platform::extensionbounds
