#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"
#include "platform/base/Value.h"

namespace qv::platform {

struct FileAttributes {
  uint64_t size = 0;  ///< bytes
  Date modificationDate;
  Date creationDate;  ///< the modification date where the file system keeps no birth time
  bool isDirectory = false;
};

/// The disk. Paths are absolute and complete (see DeviceRoot). Failures are errors with an errno
/// as code, in the posix domain. Symbolic links are not followed, neither by attributes nor by
/// removal.
///
/// Threading: thread-safe, blocking.
class FileSystem {
 public:
  virtual ~FileSystem() = default;
  [[nodiscard]] virtual bool itemExists(const std::string& path) = 0;
  /// For this process's user alone. Not its missing parents.
  virtual std::optional<Error> createDirectory(const std::string& path) = 0;
  /// Whether files can be made in this directory; what keeps them from it, otherwise. Nothing is left behind.
  virtual std::optional<Error> checkWritable(const std::string& directory) = 0;
  /// Leaves a file or a directory to this process's user alone, whoever could read it before. What is in a directory
  /// keeps its rights, and a symbolic link, which has none, is left as it is.
  virtual std::optional<Error> makePrivate(const std::string& path) = 0;
  /// The entries' names, in the order of the file system, without "." and "..".
  virtual Result<std::vector<std::string>> contentsOfDirectory(const std::string& path) = 0;
  virtual Result<FileAttributes> attributesOfItem(const std::string& path) = 0;
  /// A directory goes with its contents.
  virtual std::optional<Error> removeItem(const std::string& path) = 0;
  /// Fails where something exists at the destination.
  virtual std::optional<Error> moveItem(const std::string& source, const std::string& destination) = 0;
  /// Bytes free for this process on the file system that holds `path`.
  virtual Result<uint64_t> freeSizeOfFileSystem(const std::string& path) = 0;
  /// The whole content of a small file (1 MiB at most).
  virtual Result<std::string> readFile(const std::string& path) = 0;
  /// A regular file, for reading; EINVAL for anything else, a symbolic link included. Never blocks on a pipe.
  virtual Result<FileDescriptor> openFile(const std::string& path) = 0;
};

}  // namespace qv::platform
