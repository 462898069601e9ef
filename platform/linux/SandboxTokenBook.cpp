#include "platform/linux/SandboxTokenBook.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>

#include <array>
#include <utility>

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr size_t kMaximumTokens = 256;

std::optional<std::string> randomText() {
  std::array<uint8_t, 32> bytes{};
  if (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) return std::nullopt;
  std::string text;
  for (const uint8_t byte : bytes) {
    for (const int digit : {byte >> 4, byte & 15}) text += "0123456789abcdef"[digit];
  }
  return text;
}

/// Never waits, as opening a pipe would.
FileDescriptor openPlainFile(const std::string& path) {
  FileDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat info {};
  if (!file.isValid() || ::fstat(file.get(), &info) != 0 || !S_ISREG(info.st_mode)) return {};
  return file;
}

}  // namespace

std::optional<std::string> SandboxTokenBook::issue(const std::string& path) {
  FileDescriptor file = openPlainFile(path);
  auto token = randomText();
  if (!file.isValid() || !token) return std::nullopt;
  const bool isKept = entries_.with([&](auto& entries) {
    return entries.size() < kMaximumTokens &&
           entries.emplace(*token, Entry{shareFileDescriptor(std::move(file))}).second;
  });
  if (isKept) return token;
  QV_LOG_ERROR(logs::kExtensions, "an extension has too many files to read");
  return std::nullopt;
}

void SandboxTokenBook::giveToRequest(const std::vector<ExtensionItem>& items, ExtensionRequestID request) {
  entries_.with([&](auto& entries) {
    for (const ExtensionItem& item : items) {
      for (const ItemProvider& attachment : item.attachments) {
        const auto* text = attachment.value.getIf<std::string>();
        const auto it = text != nullptr ? entries.find(*text) : entries.end();
        if (it != entries.end()) it->second.request = request;
      }
    }
  });
}

SharedFileDescriptor SandboxTokenBook::take(const std::string& token) {
  return entries_.with([&](auto& entries) -> SharedFileDescriptor {
    const auto it = entries.find(token);
    if (it == entries.end()) return nullptr;
    const auto file = std::move(it->second.file);
    entries.erase(it);
    return file;
  });
}

void SandboxTokenBook::revoke(const std::string& token) {
  entries_.with([&](auto& entries) { entries.erase(token); });
}

void SandboxTokenBook::endRequest(ExtensionRequestID request) {
  entries_.with([&](auto& entries) {
    std::erase_if(entries, [&](const auto& entry) { return entry.second.request == request; });
  });
}

}  // namespace qv::platform
