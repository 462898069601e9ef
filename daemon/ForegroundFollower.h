#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/Platform.h"
#include "session/QVRecording.h"

namespace qv {

/// Which application is in front, and the system recording whose sound follows it: one at a time.
///
/// Threading: sequence only. It must be held by a shared pointer.
class ForegroundFollower : public std::enable_shared_from_this<ForegroundFollower> {
 public:
  ForegroundFollower(platform::ApplicationService& applications, platform::SerialQueue& sequence);

  [[nodiscard]] bool isApplicationInForegroundWithBundleIdentifier(const std::string& bundleID);
  /// The process in front; -1 without one. The handler runs on the sequence, or at once.
  void frontmostProcess(std::function<void(int32_t processID)> handler);
  /// From now on this recording's sound is that of the application in front; in place of another recording.
  void follow(const std::shared_ptr<QVRecording>& recording);
  /// Nothing happens where another recording is followed: a late end must not take away the next one's follower.
  void clearSystemRecordingUI(const QVRecording& recording);

 private:
  void lookAtForeground();
  void followForeground(const std::shared_ptr<QVRecording>& recording, const platform::Dictionary& report);

  platform::ApplicationService& applications_;
  platform::SerialQueue& sequence_;
  const std::unique_ptr<platform::ApplicationStateMonitor> applicationStateMonitor_;
  /// Perhaps one that has ended, which takes no process any more.
  std::weak_ptr<QVRecording> followed_;
};

}  // namespace qv
