#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

namespace qv {

/// A directory of the test's own, which goes with it.
class TemporaryRoot {
 public:
  TemporaryRoot() {
    std::string name = "/tmp/quorvel-test-XXXXXX";
    EXPECT_NE(::mkdtemp(name.data()), nullptr);
    path_ = name;
  }
  ~TemporaryRoot() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  TemporaryRoot(const TemporaryRoot&) = delete;
  TemporaryRoot& operator=(const TemporaryRoot&) = delete;

  /// An absolute path of the device under this root.
  [[nodiscard]] std::string path(const std::string& path = {}) const { return path_ + path; }
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

}  // namespace qv
