#include "platform/linux/JSONLineMetricsReporter.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
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

/// 128 random bits in hexadecimal digits: no two events of any device have the same.
Result<std::string> makeIdentifier() {
  std::array<uint8_t, 16> bytes{};
  if (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size()))
    return Error::posix(errno, "getrandom");
  std::string text;
  for (const uint8_t byte : bytes) {
    constexpr char kDigits[] = "0123456789abcdef";
    text += {kDigits[byte >> 4], kDigits[byte & 15]};
  }
  return text;
}

std::string lineFor(const MetricsMessage& message, const std::string& identifier, Date now) {
  Dictionary line{
      {"id", Value(identifier)},
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
  if (message.droppedPictures) line.emplace("droppedPictures", Value(*message.droppedPictures));
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
  const auto identifier = makeIdentifier();
  if (!identifier) return identifier.error();
  const std::string line = lineFor(message, identifier.value(), clock_.now());
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
