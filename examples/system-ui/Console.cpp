#include "Console.h"

#include <unistd.h>

#include <array>
#include <cerrno>

namespace screen {

void Console::read() {
  std::array<char, 512> bytes;
  const ssize_t count = ::read(STDIN_FILENO, bytes.data(), bytes.size());
  if (count < 0 && (errno == EINTR || errno == EAGAIN)) return;
  if (count <= 0) {
    events_.ended();
    return;
  }
  pending_.append(bytes.data(), static_cast<size_t>(count));
  for (size_t end; (end = pending_.find('\n')) != std::string::npos;) {
    const std::string line = pending_.substr(0, end);
    pending_.erase(0, end + 1);
    events_.line(line);
  }
}

}  // namespace screen
