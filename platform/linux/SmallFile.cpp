#include "platform/linux/SmallFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>

namespace qv::platform {
namespace {

std::optional<Error> writeAndSync(const FileDescriptor& file, std::string_view content) {
  while (!content.empty()) {
    const ssize_t count = ::write(file.get(), content.data(), content.size());
    if (count < 0 && errno != EINTR) return Error::posix(errno, "write");
    content.remove_prefix(static_cast<size_t>(std::max<ssize_t>(count, 0)));
  }
  return ::fsync(file.get()) == 0 ? std::nullopt : std::optional(Error::posix(errno, "fsync"));
}

}  // namespace

Result<std::string> readSmallFile(const std::string& path) {
  // O_NONBLOCK: opening a pipe for reading would wait for its writer.
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file.isValid()) return Error::posix(errno, path);
  return readSmallFile(file);
}

Result<std::string> readSmallFile(const FileDescriptor& file) {
  struct stat info {};
  if (::fstat(file.get(), &info) != 0) return Error::posix(errno, "fstat");
  if (!S_ISREG(info.st_mode)) return Error::posix(EINVAL, "not a regular file");
  std::string content;
  char chunk[16384];
  for (;;) {
    const ssize_t count = ::read(file.get(), chunk, sizeof chunk);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return Error::posix(errno, "read");
    if (count == 0) return content;
    content.append(chunk, static_cast<size_t>(count));
    if (content.size() > kMaximumSmallFileSize) return Error::posix(EFBIG, "read");
  }
}

std::optional<Error> replaceSmallFile(const std::string& path, std::string_view content) {
  const std::string made = path + ".new";
  (void)::unlink(made.c_str());
  const FileDescriptor file(::open(made.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  if (!file.isValid()) return Error::posix(errno, made);
  auto failure = writeAndSync(file, content);
  if (!failure && ::rename(made.c_str(), path.c_str()) != 0) failure = Error::posix(errno, path);
  if (failure) {
    (void)::unlink(made.c_str());
    return failure;
  }
  const std::string directory = std::filesystem::path(path).parent_path();
  const FileDescriptor parent(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return parent.isValid() && ::fsync(parent.get()) == 0 ? std::nullopt : std::optional(Error::posix(errno, directory));
}

std::optional<Error> makeDirectories(const std::string& path) {
  std::error_code failure;
  std::filesystem::create_directories(path, failure);
  return failure ? std::optional(Error::posix(failure.value(), path)) : std::nullopt;
}

bool isSafeFileStem(std::string_view name) {
  constexpr size_t kMaximumLength = 200;
  return !name.empty() && name.size() <= kMaximumLength && name.front() != '.' &&
         std::all_of(name.begin(), name.end(), [](char c) {
           return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' || c == '-' ||
                  c == '_';
         });
}

}  // namespace qv::platform
