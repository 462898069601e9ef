#include "platform/headless/HeadlessStatusBar.h"

#include <mutex>

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

/// Threading: as StatusBarOverrideAssertion.
class LoggedOverride final : public StatusBarOverrideAssertion {
 public:
  explicit LoggedOverride(const StatusBarOverride& shown) { update(shown); }
  ~LoggedOverride() override { QV_LOG_INFO(logs::kUI, "headless status bar: empty"); }
  void update(const StatusBarOverride& shown) override {
    std::lock_guard lock(mutex_);
    if (shown.text == text_) return;  // the time alone is no news
    text_ = shown.text;
    QV_LOG_INFO(logs::kUI, "headless status bar: \"%s\" %s", text_.c_str(), shown.time.c_str());
  }

 private:
  std::mutex mutex_;
  std::string text_;
};

}  // namespace

std::unique_ptr<StatusBarOverrideAssertion> HeadlessStatusBar::acquire(
    const StatusBarOverride& shown, std::weak_ptr<StatusBarOverrideCoordinatorDelegate>) {
  return std::make_unique<LoggedOverride>(shown);
}

}  // namespace qv::platform
