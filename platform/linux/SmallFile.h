#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform {

/// Small files are bounded, in bytes.
inline constexpr size_t kMaximumSmallFileSize = 1 << 20;

/// The whole content of a regular file; EFBIG over kMaximumSmallFileSize, EINVAL for anything but a
/// regular file. Never blocks on a pipe or device.
Result<std::string> readSmallFile(const std::string& path);
/// The same of an open file, from where it stands.
Result<std::string> readSmallFile(const FileDescriptor& file);

/// Writes a whole small file, for the daemon's user alone (0600): it is there as it was, or as it is to be, and on the
/// disk when this returns.
std::optional<Error> replaceSmallFile(const std::string& path, std::string_view content);

/// Makes a directory and its parents; no failure where it is there already.
std::optional<Error> makeDirectories(const std::string& path);

/// Whether a name that came from outside is safe as the stem of a file's name: letters, digits, '.',
/// '-' and '_', not beginning with '.', 1 to 200 characters.
bool isSafeFileStem(std::string_view name);

}  // namespace qv::platform
