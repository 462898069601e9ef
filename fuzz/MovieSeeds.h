#pragma once

#include <string>

namespace qv::fuzz {

/// A small movie with pictures and sound as a crash leaves it after a number of whole fragments; its media is no
/// real stream.
std::string growingMovie(int fragments);
/// The same after its finish.
std::string finishedMovie(int fragments);

/// A file in a directory of its own, for what only works on files. Both go with this object.
class ScratchFile {
 public:
  ScratchFile();
  ~ScratchFile();
  [[nodiscard]] const std::string& path() const { return path_; }
  void write(const std::string& bytes) const;
  [[nodiscard]] std::string read() const;
  /// Whether the directory holds nothing else.
  [[nodiscard]] bool isAlone() const;

 private:
  std::string directory_;
  std::string path_;
};

}  // namespace qv::fuzz
