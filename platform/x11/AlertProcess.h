#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Result.h"
#include "platform/UserAlert.h"

namespace qv::platform {

/// The dialogue program, showing one alert. Destroying it kills the program and waits for its end.
///
/// The user's answer is the label of a button that the program writes; its exit status says
/// nothing, since a dialogue that another client destroyed looks like one that was confirmed.
///
/// Threading: used by one thread at a time.
class AlertProcess {
 public:
  static Result<AlertProcess> start(const UserAlertRequest& request, const std::string& display);
  AlertProcess(AlertProcess&& other) noexcept;
  AlertProcess& operator=(AlertProcess&&) = delete;
  ~AlertProcess();

  [[nodiscard]] pid_t pid() const { return pid_; }
  /// Readable when the program has ended.
  [[nodiscard]] int endFd() const { return process_.get(); }
  /// Readable when `readOutput` is due; then until `readOutput` answers false.
  [[nodiscard]] int outputFd() const { return output_.get(); }
  bool readOutput();
  /// What the output so far means.
  [[nodiscard]] UserAlertAnswer answer() const;

 private:
  struct Button {
    std::string label;  // as the program gets it and writes it
    UserAlertAnswer answer;
  };
  static std::vector<Button> buttonsOf(const UserAlertRequest& request);
  AlertProcess(pid_t pid, FileDescriptor process, FileDescriptor output, std::vector<Button> buttons);

  pid_t pid_;
  FileDescriptor process_;
  FileDescriptor output_;
  std::vector<Button> buttons_;
  std::string text_;
};

}  // namespace qv::platform
