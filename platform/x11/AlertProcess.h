#pragma once

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/UserAlert.h"
#include "platform/process/SpawnedProcess.h"

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

  [[nodiscard]] pid_t pid() const { return process_.processIdentifier(); }
  /// Readable when the program has ended.
  [[nodiscard]] int endFd() const { return process_.handle(); }
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
  AlertProcess(SpawnedProcess process, FileDescriptor output, std::vector<Button> buttons)
      : process_(std::move(process)), output_(std::move(output)), buttons_(std::move(buttons)) {}

  SpawnedProcess process_;
  FileDescriptor output_;
  std::vector<Button> buttons_;
  std::string text_;
};

}  // namespace qv::platform
