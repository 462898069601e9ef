#include "platform/x11/AlertProcess.h"

#include <fcntl.h>
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
  SpawnRequest program;
  program.program = kProgram;
  program.arguments = {"--question", "--switch", "--no-markup", "--title=" + request.header,
                       "--text=" + plainText(request.header + "\n\n" + request.message)};
  for (const auto& button : buttons) program.arguments.push_back("--extra-button=" + button.label);
  program.environment = childEnvironment(display);

  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return Error::posix(errno, "pipe2");
  FileDescriptor output(ends[0]);
  program.output.reset(ends[1]);
  ::fcntl(output.get(), F_SETFL, O_NONBLOCK);
  auto process = SpawnedProcess::start(std::move(program));
  if (!process) return process.error();
  return AlertProcess(std::move(*process), std::move(output), std::move(buttons));
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
