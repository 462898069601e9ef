#pragma once

#include <algorithm>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/threads/Log.h"

namespace qv::fakes {

/// Collects the log lines of every level while it lives; then the real log is back. One at a time.
///
/// Threading: thread-safe.
class LogRecorder {
 public:
  LogRecorder() : formerLevel_(platform::detail::logThreshold.load()) {
    platform::setLogLevel(platform::LogLevel::Debug);
    platform::setLogSink([this](const platform::LogLine& line) {
      std::lock_guard lock(mutex_);
      lines_.push_back(line);
    });
  }
  ~LogRecorder() {
    platform::setLogSink({});
    platform::setLogLevel(formerLevel_);
  }
  LogRecorder(const LogRecorder&) = delete;
  LogRecorder& operator=(const LogRecorder&) = delete;

  [[nodiscard]] std::vector<platform::LogLine> lines() const {
    std::lock_guard lock(mutex_);
    return lines_;
  }
  /// How many lines read exactly so.
  [[nodiscard]] size_t count(std::string_view text) const {
    std::lock_guard lock(mutex_);
    return static_cast<size_t>(
        std::count_if(lines_.begin(), lines_.end(), [&](const auto& line) { return line.text == text; }));
  }
  [[nodiscard]] bool contains(std::string_view text) const { return count(text) > 0; }
  /// How many lines hold `part` somewhere.
  [[nodiscard]] size_t countContaining(std::string_view part) const {
    std::lock_guard lock(mutex_);
    return static_cast<size_t>(std::count_if(
        lines_.begin(), lines_.end(), [&](const auto& line) { return line.text.find(part) != std::string::npos; }));
  }
  void clear() {
    std::lock_guard lock(mutex_);
    lines_.clear();
  }

 private:
  const platform::LogLevel formerLevel_;
  mutable std::mutex mutex_;
  std::vector<platform::LogLine> lines_;
};

}  // namespace qv::fakes
