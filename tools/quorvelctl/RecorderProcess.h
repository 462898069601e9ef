#pragma once

#include <sys/types.h>

#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

namespace ctl {

/// The program that records, as a child. It is a bundle of its own, with the right to record the screen; this one is
/// none, so that it can look at the daemon as often and from as many places as it likes. The child says what happens in
/// lines of JSON, and stops and saves when it is told to, or when this program is gone.
///
/// Threading: one thread.
class RecorderProcess {
 public:
  /// A Failure where it is not installed or cannot be started.
  explicit RecorderProcess(const std::vector<std::string>& arguments);
  ~RecorderProcess();
  RecorderProcess(const RecorderProcess&) = delete;
  RecorderProcess& operator=(const RecorderProcess&) = delete;

  /// Readable when it says something, or has ended.
  [[nodiscard]] int descriptor() const { return said_; }
  /// The next line, waited for; nothing when it has ended.
  std::optional<nlohmann::json> next();
  /// Whether a line is here already.
  [[nodiscard]] bool hasLine() const { return pending_.find('\n') != std::string::npos; }
  /// It stops its recording and saves the movie.
  void stop();
  /// Where it is; empty where it is not installed.
  [[nodiscard]] static std::string path();

 private:
  pid_t child_ = -1;
  int said_ = -1;
  int life_ = -1;  ///< its standard input: it stops when this is closed
  std::string pending_;
};

}  // namespace ctl
