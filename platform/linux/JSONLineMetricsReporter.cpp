#include "platform/linux/JSONLineMetricsReporter.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <utility>

#include "platform/base/FileDescriptor.h"
#include "platform/linux/Json.h"
#include "platform/linux/SmallFile.h"

namespace qv::platform {
namespace {

constexpr size_t kMaximumFileSize = 1 << 20;
constexpr int kOldFiles = 4;

std::string lineFor(const MetricsMessage& message, Date now) {
  const Dictionary line{
      {"time", Value(now)},
      {"clientType", Value(message.clientType)},
      {"clientVersion", Value(message.clientVersion)},
      {"sessionID", Value(message.sessionID)},
      {"batchEvent", Value(message.batchEvent)},
      {"userInfoRequired", Value(message.userInfoRequired)},
      {"clientName", Value(message.clientName)},
      {"serviceName", Value(message.serviceName)},
      {"category", Value(int32_t{message.category})},
      {"type", Value(int32_t{message.type})},
      {"payload", Value(message.payload)},
  };
  return serializeJSON(Value(line)) + "\n";
}

size_t sizeOf(const std::string& path) {
  struct stat info {};
  return ::stat(path.c_str(), &info) == 0 ? static_cast<size_t>(info.st_size) : 0;
}

}  // namespace

JSONLineMetricsReporter::JSONLineMetricsReporter(std::string directory, const Clock& clock)
    : directory_(std::move(directory)), path_(directory_ + "/metrics.jsonl"), clock_(clock) {}

std::optional<Error> JSONLineMetricsReporter::sendMessage(const MetricsMessage& message) {
  const std::string line = lineFor(message, clock_.now());
  if (line.size() > kMaximumFileSize) return Error::posix(EMSGSIZE, "metrics message");
  std::lock_guard lock(mutex_);
  if (auto error = makeDirectories(directory_)) return error;
  if (sizeOf(path_) + line.size() > kMaximumFileSize) rotate();
  return append(line);
}

void JSONLineMetricsReporter::rotate() const {
  for (int number = kOldFiles; number > 0; --number) {
    const std::string younger = number == 1 ? path_ : path_ + "." + std::to_string(number - 1);
    (void)std::rename(younger.c_str(), (path_ + "." + std::to_string(number)).c_str());
  }
}

std::optional<Error> JSONLineMetricsReporter::append(const std::string& line) const {
  // Not blocking: a pipe that nobody reads must not hold up the end of a recording.
  constexpr int kFlags = O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
  const FileDescriptor file(::open(path_.c_str(), kFlags, 0600));
  if (!file.isValid()) return Error::posix(errno, path_);
  const off_t before = ::lseek(file.get(), 0, SEEK_END);
  const ssize_t count = ::write(file.get(), line.data(), line.size());
  if (count == static_cast<ssize_t>(line.size())) return std::nullopt;
  const int failure = count < 0 ? errno : ENOSPC;
  if (count > 0 && ::ftruncate(file.get(), before) != 0) return Error::posix(errno, path_);
  return Error::posix(failure, path_);
}

}  // namespace qv::platform
