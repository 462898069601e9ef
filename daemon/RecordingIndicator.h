#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/threads/SerialQueue.h"
#include "session/QVRecording.h"
#include "ui/QVStatusBarAssertion.h"
#include "ui/StopRecordingAlert.h"

namespace qv {

/// The indicator of one recording: it is shown as long as this lives. A press on it asks the user whether to stop.
///
/// Threading: made and destroyed on the sequence, where its events come, too; the status bar's model is of the main
/// queue.
class RecordingIndicator final : public QVStatusBarAssertionDelegate,
                                 public std::enable_shared_from_this<RecordingIndicator> {
 public:
  struct Events {
    std::function<void(const std::string& time)> timeChanged;
    /// The user wants it to end.
    std::function<void(const std::shared_ptr<QVRecording>&)> stop;
  };

  /// `statusBar`: null where nothing is to be seen; the time is told nevertheless.
  [[nodiscard]] static std::shared_ptr<RecordingIndicator> show(std::shared_ptr<RecordingContext> context,
                                                                platform::StatusBarOverrideCoordinator* statusBar,
                                                                const std::shared_ptr<QVRecording>& recording,
                                                                Events events);
  ~RecordingIndicator() override;
  [[nodiscard]] bool isOf(const QVRecording& recording) const { return recording_.get() == &recording; }
  /// As it was told last; empty before.
  [[nodiscard]] const std::string& time() const { return time_; }

 private:
  RecordingIndicator(std::shared_ptr<RecordingContext> context, std::shared_ptr<QVRecording> recording, Events events);
  [[nodiscard]] Progress statusBarAssertionProgress() override;
  void statusBarAssertionDidUpdateTime(const std::string& time) override;
  void statusBarAssertionWasPressed() override;
  void askWhetherToStop();

  const std::shared_ptr<RecordingContext> context_;
  const std::shared_ptr<QVRecording> recording_;
  const Events events_;
  const StopRecordingAlert stopAlert_;
  const std::shared_ptr<QVStatusBarAssertion> assertion_;
  // The sequence's:
  std::string time_;
  std::unique_ptr<platform::UserAlert> question_;
};

}  // namespace qv
