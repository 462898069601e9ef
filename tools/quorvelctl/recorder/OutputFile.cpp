#include "tools/quorvelctl/recorder/OutputFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <utility>
#include <vector>

#include "tools/quorvelctl/Failure.h"

namespace ctl {

namespace {
constexpr size_t kPiece = 1 << 20;  // bytes
}

OutputFile::OutputFile(std::string path) : path_(std::move(path)), temporary_(path_ + ".XXXXXX") {
  struct stat entry {};
  if (::lstat(path_.c_str(), &entry) == 0) {
    throw Failure{Exit::NotWritable, path_ + " exists: name another file, or remove it"};
  }
  file_ = ::mkostemp(temporary_.data(), O_CLOEXEC);
  if (file_ < 0) fail("cannot be made");
  // As a file that is made plainly.
  const mode_t mask = ::umask(0);
  ::umask(mask);
  ::fchmod(file_, 0666 & ~mask);
}

OutputFile::~OutputFile() {
  if (file_ >= 0) ::close(file_);
  if (!temporary_.empty()) ::unlink(temporary_.c_str());
}

void OutputFile::fail(const char* what) const {
  throw Failure{Exit::NotWritable, path_ + " " + what + ": " + std::strerror(errno)};
}

uint64_t OutputFile::fillFrom(int source) {
  std::vector<char> piece(kPiece);
  uint64_t total = 0;
  while (true) {
    const ssize_t count = ::pread(source, piece.data(), piece.size(), static_cast<off_t>(total));
    if (count < 0) throw Failure{Exit::Failed, std::string("the movie cannot be read: ") + std::strerror(errno)};
    if (count == 0) break;
    for (ssize_t done = 0; done < count;) {
      const ssize_t written = ::write(file_, piece.data() + done, static_cast<size_t>(count - done));
      if (written < 0) fail("cannot be written");
      done += written;
    }
    total += static_cast<uint64_t>(count);
  }
  name();
  return total;
}

void OutputFile::name() {
  if (::fsync(file_) != 0 || ::close(std::exchange(file_, -1)) != 0) fail("cannot be written");
  int result = ::renameat2(AT_FDCWD, temporary_.c_str(), AT_FDCWD, path_.c_str(), RENAME_NOREPLACE);
  // Not every file system can look and rename in one.
  if (result != 0 && errno == EINVAL) result = ::rename(temporary_.c_str(), path_.c_str());
  if (result != 0) fail("cannot be named");
  temporary_.clear();
}

}  // namespace ctl
