#pragma once

#include <functional>
#include <optional>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform {

/// Copies stand under a name that begins so until they are complete.
inline constexpr const char kUnfinishedCopyPrefix[] = ".quorvel-copy-";

/// Opens a regular file for reading; EINVAL for anything else, a symbolic link included.
Result<FileDescriptor> openRegularFile(const std::string& path);

/// Copies `source` (a regular file) into `directory`: shares the blocks where the file system can,
/// copies inside the kernel otherwise. The copy grows under a hidden
/// name, is flushed to the disk, and only then gets its name, which `nameForAttempt` yields (attempt
/// 0, 1, …; the empty string gives up with EEXIST). Nothing that exists is replaced, and no
/// half copy stays behind, short of a crash. The result is the name.
Result<std::string> copyIntoDirectory(const FileDescriptor& source, const std::string& directory,
                                      const std::function<std::string(int)>& nameForAttempt);

/// Renames without replacing: EEXIST where the destination exists.
std::optional<Error> renameExclusively(const std::string& source, const std::string& destination);

}  // namespace qv::platform
