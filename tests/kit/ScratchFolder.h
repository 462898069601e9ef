#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

namespace qv::kit {

/// A folder of the test's own, which goes with it. Often a device's root: paths are absolute ones below it.
///
/// Threading: as the file system.
class ScratchFolder {
 public:
  explicit ScratchFolder(const std::string& parent = "/tmp") {
    std::string name = parent + "/quorvel-test-XXXXXX";
    EXPECT_NE(::mkdtemp(name.data()), nullptr);
    path_ = name;
  }
  ~ScratchFolder() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  ScratchFolder(const ScratchFolder&) = delete;
  ScratchFolder& operator=(const ScratchFolder&) = delete;

  /// An absolute path of the device under this root.
  [[nodiscard]] std::string path(const std::string& path = {}) const { return path_ + path; }
  [[nodiscard]] std::string operator/(const std::string& name) const { return path_ + "/" + name; }
  /// Writes a file, and makes the directories above it; its full path.
  std::string write(const std::string& path, const std::string& content) const {
    const std::string full = path_ + path;
    std::filesystem::create_directories(std::filesystem::path(full).parent_path());
    std::ofstream(full, std::ios::binary) << content;
    return full;
  }
  [[nodiscard]] std::string read(const std::string& path) const {
    std::ifstream file(path_ + path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), {});
  }
  [[nodiscard]] bool exists(const std::string& path) const { return std::filesystem::exists(path_ + path); }

 private:
  std::string path_;
};

}  // namespace qv::kit
