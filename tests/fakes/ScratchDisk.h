#pragma once

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/PosixFileSystem.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::fakes {

/// A real disk, of which the device sees a scratch folder as "/". The test makes operations fail, and says how much
/// space is free. Directories list by name.
///
/// Threading: thread-safe.
class ScratchDisk final : public platform::FileSystem {
 public:
  enum class Operation { List, Attributes, Remove, Read, Write, Open };

  /// Makes a file, and the directories above it.
  void addFile(const std::string& path, const std::string& content, platform::Date modified = {}) {
    const std::string full = at(path);
    std::filesystem::create_directories(std::filesystem::path(full).parent_path());
    std::ofstream(full, std::ios::binary) << content;
    const double seconds = std::floor(modified.secondsSince1970);
    const timespec time{static_cast<time_t>(seconds), std::lround((modified.secondsSince1970 - seconds) * 1e9)};
    const timespec times[] = {time, time};
    EXPECT_EQ(::utimensat(AT_FDCWD, full.c_str(), times, 0), 0);
  }
  /// Makes a directory, and those above it.
  void addDirectory(const std::string& path) { std::filesystem::create_directories(at(path)); }
  /// Every later `operation` on `path` fails with this errno; 0 lets it work again.
  void failOn(Operation operation, const std::string& path, int errnum) {
    std::lock_guard lock(mutex_);
    failures_[{operation, at(path)}] = errnum;
  }
  void setFreeSize(uint64_t bytes) { freeSize_ = bytes; }
  /// Where this path of the device lies on the machine; where it is one of those, itself.
  [[nodiscard]] std::string at(const std::string& path) const {
    return path.starts_with(root_.path()) ? path : root_.path(path);
  }

  bool itemExists(const std::string& path) override { return disk_.itemExists(at(path)); }
  std::optional<platform::Error> createDirectory(const std::string& path) override {
    return disk_.createDirectory(at(path));
  }
  std::optional<platform::Error> checkWritable(const std::string& directory) override {
    const auto failure = failureOf(Operation::Write, directory);
    return failure ? failure : disk_.checkWritable(at(directory));
  }
  std::optional<platform::Error> makePrivate(const std::string& path) override { return disk_.makePrivate(at(path)); }
  platform::Result<std::vector<std::string>> contentsOfDirectory(const std::string& path) override {
    if (const auto failure = failureOf(Operation::List, path)) return *failure;
    auto names = disk_.contentsOfDirectory(at(path));
    if (names) std::ranges::sort(*names);
    return names;
  }
  platform::Result<platform::FileAttributes> attributesOfItem(const std::string& path) override {
    if (const auto failure = failureOf(Operation::Attributes, path)) return *failure;
    return disk_.attributesOfItem(at(path));
  }
  std::optional<platform::Error> removeItem(const std::string& path) override {
    const auto failure = failureOf(Operation::Remove, path);
    return failure ? failure : disk_.removeItem(at(path));
  }
  std::optional<platform::Error> moveItem(const std::string& source, const std::string& destination) override {
    return disk_.moveItem(at(source), at(destination));
  }
  platform::Result<uint64_t> freeSizeOfFileSystem(const std::string& path) override {
    if (itemExists(path)) return freeSize_.load();
    return platform::Error::posix(ENOENT, path);
  }
  platform::Result<std::string> readFile(const std::string& path) override {
    if (const auto failure = failureOf(Operation::Read, path)) return *failure;
    return disk_.readFile(at(path));
  }
  platform::Result<platform::FileDescriptor> openFile(const std::string& path) override {
    if (const auto failure = failureOf(Operation::Open, path)) return *failure;
    return disk_.openFile(at(path));
  }

 private:
  std::optional<platform::Error> failureOf(Operation operation, const std::string& path) {
    std::lock_guard lock(mutex_);
    const auto it = failures_.find({operation, at(path)});
    if (it == failures_.end() || it->second == 0) return std::nullopt;
    return platform::Error::posix(it->second, path);
  }

  const kit::ScratchFolder root_;
  platform::PosixFileSystem disk_;
  std::mutex mutex_;
  std::map<std::pair<Operation, std::string>, int> failures_;
  std::atomic<uint64_t> freeSize_{10'000'000'000};
};

}  // namespace qv::fakes
