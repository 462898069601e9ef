#include "platform/linux/ExtensionLog.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>

#include "platform/linux/ExtensionBounds.h"

namespace qv::platform {

/// Whatever lies there is the extension's: it may have left a link or a pipe.
ExtensionLog::ExtensionLog(const std::string& container, uid_t owner) {
  const std::string path = container + "/stderr.log";
  (void)::unlink(path.c_str());
  file_.reset(::open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  if (file_.isValid() && owner != 0) (void)!::fchown(file_.get(), owner, owner);
}

void ExtensionLog::write(std::string_view text) {
  constexpr size_t kHalf = extensionbounds::kLogSize / 2;
  if (!file_.isValid()) return;
  text.remove_prefix(text.size() - std::min(text.size(), kHalf));
  if (size_ + text.size() > extensionbounds::kLogSize) dropOlderHalf();
  const ssize_t written = ::pwrite(file_.get(), text.data(), text.size(), static_cast<off_t>(size_));
  if (written > 0) size_ += static_cast<size_t>(written);
}

/// From the next line on.
void ExtensionLog::dropOlderHalf() {
  std::string kept(extensionbounds::kLogSize / 2, '\0');
  const ssize_t count = ::pread(file_.get(), kept.data(), kept.size(), static_cast<off_t>(size_ - kept.size()));
  kept.resize(static_cast<size_t>(std::max<ssize_t>(count, 0)));
  const size_t line = kept.find('\n');
  if (line != std::string::npos) kept.erase(0, line + 1);
  (void)!::ftruncate(file_.get(), 0);
  size_ = 0;
  const ssize_t written = ::pwrite(file_.get(), kept.data(), kept.size(), 0);
  if (written > 0) size_ = static_cast<size_t>(written);
}

}  // namespace qv::platform
