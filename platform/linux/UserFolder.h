#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform {

/// Opens a directory that is to be this user's, and makes it (0700), and its parents, where it is missing. One that
/// this process's user has is given to the user, with the files in it, and closed to everybody else. Whose is the
/// user's already keeps its mode, so the user may let others in. EPERM for a third user's; an error for a symbolic link
/// too, since the user may be able to put one there. Only root can give anything away.
Result<FileDescriptor> openFolderOfUser(uid_t user, const std::string& path);

/// The names in an open directory, without "." and "..".
std::vector<std::string> namesIn(const FileDescriptor& directory);

}  // namespace qv::platform
