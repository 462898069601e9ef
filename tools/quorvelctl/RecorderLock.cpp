#include "tools/quorvelctl/RecorderLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "tools/quorvelctl/Failure.h"

namespace ctl {

namespace {

/// Of this user alone. Without a directory of its own that is one in /tmp, where nobody else's file is believed.
std::string lockPath() {
  const std::string name = "/quorvelctl-" + std::to_string(::geteuid()) + ".lock";
  const char* own = std::getenv("XDG_RUNTIME_DIR");
  if (own != nullptr && *own != '\0' && ::access(own, W_OK) == 0) return own + name;
  return (::geteuid() == 0 ? "/run" : "/tmp") + name;
}

}  // namespace

int RecorderLock::open() {
  const std::string path = lockPath();
  const int file = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
  if (file < 0) throw Failure{Exit::Failed, path + " cannot be opened: " + std::strerror(errno)};
  struct stat entry {};
  if (::fstat(file, &entry) == 0 && entry.st_uid == ::geteuid() && S_ISREG(entry.st_mode)) return file;
  ::close(file);
  throw Failure{Exit::Failed, path + " is somebody else's: set XDG_RUNTIME_DIR to a directory of yours"};
}

std::optional<RecorderLock> RecorderLock::take() {
  RecorderLock lock(open());
  if (::flock(lock.file_, LOCK_EX | LOCK_NB) != 0) return std::nullopt;
  const std::string number = std::to_string(::getpid());
  const bool isWritten = ::ftruncate(lock.file_, 0) == 0 &&
                         ::pwrite(lock.file_, number.data(), number.size(), 0) == static_cast<ssize_t>(number.size());
  if (!isWritten) throw Failure{Exit::Failed, lockPath() + " cannot be written: " + std::strerror(errno)};
  return lock;
}

std::optional<pid_t> RecorderLock::holder() {
  const RecorderLock look(open());
  if (::flock(look.file_, LOCK_SH | LOCK_NB) == 0) return std::nullopt;
  char number[16]{};
  const ssize_t count = ::pread(look.file_, number, sizeof number - 1, 0);
  const int process = count > 0 ? std::atoi(number) : 0;
  return process > 1 ? std::optional<pid_t>(process) : std::nullopt;
}

void RecorderLock::awaitRelease() {
  const RecorderLock look(open());
  while (::flock(look.file_, LOCK_SH) != 0 && errno == EINTR) {
  }
}

RecorderLock::RecorderLock(RecorderLock&& other) noexcept : file_(std::exchange(other.file_, -1)) {}

RecorderLock::~RecorderLock() {
  if (file_ >= 0) ::close(file_);
}

}  // namespace ctl
