#pragma once

#include <cstdint>
#include <string>

namespace ctl {

/// A file that is there whole or not at all: written under another name in the same directory, which is removed again
/// where it does not come to its end. It replaces nothing.
///
/// Threading: one thread.
class OutputFile {
 public:
  /// A Failure where it exists, or cannot be made there.
  explicit OutputFile(std::string path);
  ~OutputFile();
  OutputFile(const OutputFile&) = delete;
  OutputFile& operator=(const OutputFile&) = delete;

  [[nodiscard]] const std::string& path() const { return path_; }
  /// All that `source` has, from its beginning; the bytes. A Failure where it cannot be read or written.
  uint64_t fillFrom(int source);

 private:
  [[noreturn]] void fail(const char* what) const;
  void name();

  const std::string path_;
  std::string temporary_;
  int file_ = -1;
};

}  // namespace ctl
