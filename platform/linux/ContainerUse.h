#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>

namespace qv::platform {

/// What an extension has on the disk.
struct ContainerUse {
  uint64_t bytes = 0;    ///< that the disk gave for it; a file with two names counts twice
  uint64_t entries = 0;  ///< files and directories
};

/// Counts a container, without following links, and the files that `process` holds open without a name; it can have
/// none elsewhere. Directories that lie too deep to be counted (kContainerDepth) count as kContainerEntries. The count
/// ends early where it is beyond every bound. Blocking: some milliseconds for a thousand entries.
ContainerUse countContainerUse(const std::string& container, pid_t process);

}  // namespace qv::platform
