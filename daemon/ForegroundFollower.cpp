#include "daemon/ForegroundFollower.h"

#include <utility>

#include "platform/threads/Log.h"

namespace qv {

using platform::Dictionary;
namespace applicationstate = platform::applicationstate;
namespace logs = platform::logs;

namespace {

constexpr int32_t kNoProcess = -1;

int32_t processIDFrom(const Dictionary& report) {
  return static_cast<int32_t>(platform::valueForKey(report, applicationstate::kProcessIDKey).asInteger(kNoProcess));
}

}  // namespace

ForegroundFollower::ForegroundFollower(platform::ApplicationService& applications, platform::SerialQueue& sequence)
    : applications_(applications), sequence_(sequence), applicationStateMonitor_(applications.createStateMonitor()) {}

bool ForegroundFollower::isApplicationInForegroundWithBundleIdentifier(const std::string& bundleID) {
  return (applicationStateMonitor_->applicationStateForBundleIdentifier(bundleID) & platform::kApplicationForeground) !=
         0;
}

void ForegroundFollower::frontmostProcess(std::function<void(int32_t)> handler) {
  const auto frontmost = applications_.frontmostApplication();
  if (!frontmost) {
    handler(kNoProcess);
    return;
  }
  applicationStateMonitor_->applicationInfoForBundleIdentifier(
      *frontmost, [weakSelf = weak_from_this(), handler = std::move(handler)](const Dictionary& information) {
        if (const auto self = weakSelf.lock()) {
          self->sequence_.async([handler, processID = processIDFrom(information)] { handler(processID); });
        }
      });
}

void ForegroundFollower::follow(const std::shared_ptr<QVRecording>& recording) {
  followed_ = recording;
  applicationStateMonitor_->setHandler(
      [weakSelf = weak_from_this(), weakRecording = std::weak_ptr(recording)](const Dictionary& report) {
        const auto self = weakSelf.lock();
        if (!self) return;
        self->sequence_.async([self, weakRecording, report] {
          const auto followed = weakRecording.lock();
          if (followed && followed == self->followed_.lock()) self->followForeground(followed, report);
        });
      });
  lookAtForeground();
}

void ForegroundFollower::clearSystemRecordingUI(const QVRecording& recording) {
  QV_LOG(logs::kDaemon, "stop monitoring foreground apps");
  if (followed_.lock().get() == &recording) applicationStateMonitor_->setHandler(nullptr);
}

/// The front may have changed between the question at the start and the follower's first look.
void ForegroundFollower::lookAtForeground() {
  frontmostProcess([weakSelf = weak_from_this(), weakRecording = followed_](int32_t processID) {
    const auto self = weakSelf.lock();
    const auto recording = weakRecording.lock();
    if (!self || !recording || self->followed_.lock() != recording) return;
    const int32_t tapped = recording->frontmostPIDForAudioTap();
    const bool isSilent = processID < 1 && tapped < 1;
    if (!isSilent && processID != tapped) recording->updateProcessIDForAudioCaptureWithPID(processID);
  });
}

void ForegroundFollower::followForeground(const std::shared_ptr<QVRecording>& recording, const Dictionary& report) {
  const int32_t processID = processIDFrom(report);
  if (platform::valueForKey(report, applicationstate::kStateKey).asInteger() == platform::kApplicationTerminated) {
    recording->checkAndStopAppAudioForPID(processID);
  }
  if (platform::valueForKey(report, applicationstate::kIsFrontmostKey).asBool()) {
    recording->updateProcessIDForAudioCaptureWithPID(processID);
  } else if (processID == recording->frontmostPIDForAudioTap()) {
    recording->updateProcessIDForAudioCaptureWithPID(kNoProcess);
  }
}

}  // namespace qv
