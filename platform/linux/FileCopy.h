#pragma once

#include <sys/types.h>

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

/// Copies `source` (a regular file) into `directory`, as a file of `owner` that nobody else reads: shares the blocks
/// where the file system can, copies inside the kernel otherwise. The copy grows under a hidden
/// name, is flushed to the disk, and only then gets its name, which `nameForAttempt` yields (attempt
/// 0, 1, …; the empty string gives up with EEXIST). Nothing that exists is replaced, and no
/// half copy stays behind, short of a crash. The result is the name, under which the copy was seen; ESTALE where
/// somebody who may write there has put something else in its place.
Result<std::string> copyIntoDirectory(const FileDescriptor& source, const FileDescriptor& directory, uid_t owner,
                                      const std::function<std::string(int)>& nameForAttempt);

/// Renames without replacing: EEXIST where the destination exists. Relative paths begin at `directory`, which may be
/// AT_FDCWD.
std::optional<Error> renameExclusively(int directory, const std::string& source, const std::string& destination);

}  // namespace qv::platform
