#include "tools/quorvelctl/Output.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "tools/quorvelctl/Failure.h"
#include "tools/quorvelctl/Wording.h"

namespace ctl {

void holdStandardDescriptors() {
  for (const int descriptor : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (::fcntl(descriptor, F_GETFD) >= 0 || errno != EBADF) continue;
    // The lowest free number is this one. Standard input for writing, the others for reading: no use of them succeeds.
    if (::open("/dev/null", descriptor == STDIN_FILENO ? O_WRONLY : O_RDONLY) < 0) return;
  }
}

Output::Output() : isTerminal_(::isatty(STDOUT_FILENO) != 0) {}

size_t Output::columns() {
  winsize size{};
  return ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0 ? size.ws_col : 80;
}

void Output::write(const std::string& bytes) {
  for (size_t done = 0; done < bytes.size();) {
    const ssize_t count = ::write(STDOUT_FILENO, bytes.data() + done, bytes.size() - done);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) {
      throw Failure{Exit::NotWritable, std::string("standard output cannot be written: ") + std::strerror(errno)};
    }
    done += static_cast<size_t>(count);
  }
}

void Output::line(const std::string& text) { write((std::exchange(hasDrawn_, false) ? "\r\x1b[K" : "") + text + "\n"); }

void Output::redraw(const std::string& text) {
  if (!isTerminal_) return;
  // The last column stays free: some terminals wrap when it is filled.
  write("\r\x1b[K" + cutTo(text, columns() - 1));
  hasDrawn_ = true;
}

void Output::keep() {
  if (std::exchange(hasDrawn_, false)) write("\n");
}

}  // namespace ctl
