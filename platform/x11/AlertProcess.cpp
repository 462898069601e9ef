#include "platform/x11/AlertProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

extern char** environ;

namespace qv::platform {
namespace {

constexpr char kProgram[] = "zenity";
constexpr size_t kLongestOutput = 64 * 1024;

std::string doubled(const std::string& text, char special) {
  std::string result;
  for (const char c : text) {
    if (c == special) result.push_back(special);
    result.push_back(c);
  }
  return result;
}

/// The program underlines the letter after "_" in labels; doubled it is an ordinary character.
std::string plainLabel(const std::string& text) { return doubled(text, '_'); }
/// The program reads C escapes in texts.
std::string plainText(const std::string& text) { return doubled(text, '\\'); }

std::vector<std::string> childEnvironment(const std::string& display) {
  // Texts are UTF-8 whatever the daemon's own locale is; the accessibility bridge would start a
  // session bus.
  std::vector<std::string> variables{"DISPLAY=" + display, "GDK_BACKEND=x11", "LC_ALL=C.UTF-8", "NO_AT_BRIDGE=1"};
  const size_t own = variables.size();
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const char* end = std::strchr(*entry, '=');
    if (end == nullptr) continue;
    const std::string name(*entry, static_cast<size_t>(end - *entry) + 1);
    const bool isReplaced = std::any_of(variables.begin(), variables.begin() + static_cast<ptrdiff_t>(own),
                                        [&](const auto& v) { return v.compare(0, name.size(), name) == 0; });
    if (!isReplaced) variables.emplace_back(*entry);
  }
  return variables;
}

std::vector<char*> pointersTo(std::vector<std::string>& strings) {
  std::vector<char*> pointers;
  for (auto& string : strings) pointers.push_back(string.data());
  pointers.push_back(nullptr);
  return pointers;
}

class SpawnSettings {
 public:
  explicit SpawnSettings(int outputFd) {
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, outputFd, STDOUT_FILENO);
    posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
    // The daemon blocks and ignores signals; the program must not inherit that. In a process group
    // of its own a terminal's interrupt does not answer the alert.
    sigset_t none, all;
    sigemptyset(&none);
    sigfillset(&all);
    posix_spawnattr_init(&attributes);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setsigdefault(&attributes, &all);
    posix_spawnattr_setpgroup(&attributes, 0);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP);
  }
  ~SpawnSettings() {
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
  }
  SpawnSettings(const SpawnSettings&) = delete;
  SpawnSettings& operator=(const SpawnSettings&) = delete;
  posix_spawn_file_actions_t actions;
  posix_spawnattr_t attributes;
};

}  // namespace

std::vector<AlertProcess::Button> AlertProcess::buttonsOf(const UserAlertRequest& request) {
  std::vector<Button> buttons;
  const auto add = [&](const std::string& text, UserAlertAnswer answer) {
    if (!text.empty()) buttons.push_back({plainLabel(text), answer});
  };
  add(request.defaultButton, UserAlertAnswer::Default);
  add(request.alternateButton, UserAlertAnswer::Alternate);
  add(request.otherButton, UserAlertAnswer::Other);
  // The first button takes the Return key: it is to be the one that refuses.
  if (buttons.size() == 2) std::swap(buttons.front(), buttons.back());
  return buttons;
}

Result<AlertProcess> AlertProcess::start(const UserAlertRequest& request, const std::string& display) {
  auto buttons = buttonsOf(request);
  if (buttons.empty()) return Error::posix(EINVAL, "an alert without a button");
  std::vector<std::string> arguments{kProgram,
                                     "--question",
                                     "--switch",
                                     "--no-markup",
                                     "--title=" + request.header,
                                     "--text=" + plainText(request.header + "\n\n" + request.message)};
  for (const auto& button : buttons) arguments.push_back("--extra-button=" + button.label);

  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return Error::posix(errno, "pipe2");
  FileDescriptor output(ends[0]), childOutput(ends[1]);
  ::fcntl(output.get(), F_SETFL, O_NONBLOCK);
  const SpawnSettings settings(childOutput.get());
  auto environment = childEnvironment(display);
  pid_t pid = -1;
  const int failure = ::posix_spawnp(&pid, kProgram, &settings.actions, &settings.attributes,
                                     pointersTo(arguments).data(), pointersTo(environment).data());
  if (failure != 0) return Error::posix(failure, kProgram);
  FileDescriptor process(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  if (!process.isValid()) {
    const int reason = errno;
    ::kill(pid, SIGKILL);
    ::waitpid(pid, nullptr, 0);
    return Error::posix(reason, "pidfd_open");
  }
  return AlertProcess(pid, std::move(process), std::move(output), std::move(buttons));
}

AlertProcess::AlertProcess(pid_t pid, FileDescriptor process, FileDescriptor output, std::vector<Button> buttons)
    : pid_(pid), process_(std::move(process)), output_(std::move(output)), buttons_(std::move(buttons)) {}

AlertProcess::AlertProcess(AlertProcess&& other) noexcept
    : pid_(other.pid_),
      process_(std::move(other.process_)),
      output_(std::move(other.output_)),
      buttons_(std::move(other.buttons_)),
      text_(std::move(other.text_)) {}

AlertProcess::~AlertProcess() {
  if (!process_.isValid()) return;
  ::syscall(SYS_pidfd_send_signal, process_.get(), SIGKILL, nullptr, 0);
  siginfo_t info{};
  while (::waitid(P_PIDFD, static_cast<id_t>(process_.get()), &info, WEXITED) != 0 && errno == EINTR) {
  }
}

bool AlertProcess::readOutput() {
  char buffer[4096];
  while (true) {
    const ssize_t got = ::read(output_.get(), buffer, sizeof buffer);
    if (got > 0) {
      text_.append(buffer, static_cast<size_t>(got));
      if (text_.size() > kLongestOutput) return false;
    } else if (got == 0 || (errno != EINTR && errno != EAGAIN)) {
      return false;
    } else if (errno == EAGAIN) {
      return true;
    }
  }
}

UserAlertAnswer AlertProcess::answer() const {
  std::string label = text_;
  if (!label.empty() && label.back() == '\n') label.pop_back();
  for (const auto& button : buttons_)
    if (button.label == label) return button.answer;
  return UserAlertAnswer::Cancelled;
}

}  // namespace qv::platform
