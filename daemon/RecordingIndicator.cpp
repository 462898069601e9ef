#include "daemon/RecordingIndicator.h"

#include <utility>

#include "platform/threads/Log.h"

namespace qv {

namespace logs = platform::logs;

namespace {

/// Empty for what is no broadcast.
std::string broadcastServiceName(const RecordingSettings& settings) {
  if (!settings.broadcast) return {};
  const auto& extension = *settings.broadcast->info.extension;
  return extension.displayName.empty() ? extension.identifier : extension.displayName;
}

}  // namespace

std::shared_ptr<RecordingIndicator> RecordingIndicator::show(std::shared_ptr<RecordingContext> context,
                                                             platform::StatusBarOverrideCoordinator* statusBar,
                                                             const std::shared_ptr<QVRecording>& recording,
                                                             Events events) {
  std::shared_ptr<RecordingIndicator> indicator(
      new RecordingIndicator(std::move(context), recording, std::move(events)));
  QVStatusBarAssertion& model = *indicator->assertion_;
  model.coordinator = statusBar;
  model.assertionDelegate = indicator;
  model.microphoneEnabled = recording->microphoneEnabled();
  model.broadcasting = recording->settings().broadcast.has_value();
  model.broadcastServiceName = broadcastServiceName(recording->settings());
  indicator->context_->platform.mainQueue->async(
      [assertion = indicator->assertion_, processID = recording->frontmostPIDForAudioTap()] {
        assertion->showDoubleHeightStatusBarWithPid(processID);
      });
  return indicator;
}

RecordingIndicator::RecordingIndicator(std::shared_ptr<RecordingContext> context,
                                       std::shared_ptr<QVRecording> recording, Events events)
    : context_(std::move(context)),
      recording_(std::move(recording)),
      events_(std::move(events)),
      stopAlert_(*context_->platform.userAlerts, context_->texts),
      assertion_(std::make_shared<QVStatusBarAssertion>(context_->platform, context_->texts)) {}

/// After what was queued before: it cannot be shown once this has gone.
RecordingIndicator::~RecordingIndicator() {
  context_->platform.mainQueue->async(
      [assertion = assertion_, context = context_] { assertion->invalidateDoubleHeightStatusBar(); });
}

QVStatusBarAssertionDelegate::Progress RecordingIndicator::statusBarAssertionProgress() {
  return {recording_->recordedSeconds(), recording_->state() == QVRecording::State::Paused};
}

void RecordingIndicator::statusBarAssertionDidUpdateTime(const std::string& time) {
  context_->sequence.async(weak_from_this(), [time](RecordingIndicator& self) {
    self.time_ = time;
    self.events_.timeChanged(time);
  });
}

void RecordingIndicator::statusBarAssertionWasPressed() {
  context_->sequence.async(weak_from_this(), [](RecordingIndicator& self) { self.askWhetherToStop(); });
}

/// Presses while the question stands ask nothing more. With the recording's end it is taken away.
void RecordingIndicator::askWhetherToStop() {
  if (question_ || !recording_->isRecording()) return;
  question_ = stopAlert_.present(broadcastServiceName(recording_->settings()),
                                 [weakSelf = weak_from_this(), context = context_](bool isToStop) {
                                   context->sequence.async(weakSelf, [isToStop](RecordingIndicator& self) {
                                     self.question_.reset();
                                     if (!isToStop) return;
                                     QV_LOG(logs::kDaemon, "the user stops the recording");
                                     self.events_.stop(self.recording_);
                                   });
                                 });
}

}  // namespace qv
