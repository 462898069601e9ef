#pragma once

#include <quorvel/Status.h>

#include <functional>
#include <memory>
#include <nlohmann/json.hpp>
#include <string>

namespace ctl {

/// The bundle that records for this program.
inline constexpr const char kOwnBundle[] = "com.tarnwick.quorvelctl";

/// What the daemon says, waited for, as JSON. What fails is a Failure.
///
/// Threading: one thread.
class DaemonStatus {
 public:
  DaemonStatus();
  [[nodiscard]] nlohmann::json recordings();
  [[nodiscard]] nlohmann::json startConditions(const std::string& bundleID, bool system, bool microphone);
  [[nodiscard]] nlohmann::json movies();
  [[nodiscard]] nlohmann::json device();

 private:
  using Ask = std::function<void(quorvel::StatusReader::Handler)>;
  nlohmann::json answer(const Ask& ask);

  const std::unique_ptr<quorvel::StatusReader> reader_;
};

/// Whether and why the daemon's socket takes no connection; empty where it does. One line that says what to do.
[[nodiscard]] std::string whyUnreachable();

}  // namespace ctl
