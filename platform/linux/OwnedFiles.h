#pragma once

#include <sys/stat.h>

#include <string>

namespace qv::platform {

/// Whether only root and this process's user can write to what `info` tells of.
[[nodiscard]] bool isWritableByOwnersOnly(const struct stat& info);

/// The first of a file and the directories on the way to it that anybody else could change, or make into another;
/// empty where there is none. In a directory with the sticky bit, such as /tmp, others cannot replace what is not
/// theirs. `path` is absolute and without links.
[[nodiscard]] std::string whatOthersCanWrite(const std::string& path);

}  // namespace qv::platform
