#pragma once

#include "platform/FileSystem.h"

namespace qv::platform {

/// The disk by POSIX calls. A move to another file system copies a regular file and then removes the
/// source; for anything else it fails with EXDEV.
///
/// Threading: thread-safe, blocking.
class PosixFileSystem final : public FileSystem {
 public:
  bool itemExists(const std::string& path) override;
  std::optional<Error> createDirectory(const std::string& path) override;
  std::optional<Error> checkWritable(const std::string& directory) override;
  std::optional<Error> makePrivate(const std::string& path) override;
  Result<std::vector<std::string>> contentsOfDirectory(const std::string& path) override;
  Result<FileAttributes> attributesOfItem(const std::string& path) override;
  std::optional<Error> removeItem(const std::string& path) override;
  std::optional<Error> moveItem(const std::string& source, const std::string& destination) override;
  Result<uint64_t> freeSizeOfFileSystem(const std::string& path) override;
  Result<std::string> readFile(const std::string& path) override;
  Result<FileDescriptor> openFile(const std::string& path) override;
};

}  // namespace qv::platform
