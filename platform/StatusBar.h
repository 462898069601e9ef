#pragma once

#include <memory>
#include <string>

namespace qv::platform {

/// What the status bar says while something is recorded.
struct StatusBarOverride {
  std::string text;  ///< plain, in the user's language
  std::string time;  ///< elapsed, as "1:05"
  bool isPaused = false;
  bool operator==(const StatusBarOverride&) const = default;
};

/// A claim on the status bar: while it lives, the bar shows what it was given last. Where the display goes away and
/// comes back, it is shown again.
///
/// Threading: thread-safe; an update does not wait for the display. To be destroyed by anybody but the delegate's call.
class StatusBarOverrideAssertion {
 public:
  virtual ~StatusBarOverrideAssertion() = default;
  virtual void update(const StatusBarOverride& shown) = 0;
};

/// Gets what the user does with an overridden status bar.
///
/// Threading: called on a thread of the service's.
class StatusBarOverrideCoordinatorDelegate {
 public:
  virtual ~StatusBarOverrideCoordinatorDelegate() = default;
  /// By pointer or touch. Comes once for each press.
  virtual void statusBarOverrideWasPressed() = 0;
};

/// The status bar of the device. It covers whatever applications show, and takes the keyboard from none of them.
///
/// Threading: thread-safe.
class StatusBarOverrideCoordinator {
 public:
  virtual ~StatusBarOverrideCoordinator() = default;
  /// Never nothing: what cannot be shown is logged.
  [[nodiscard]] virtual std::unique_ptr<StatusBarOverrideAssertion> acquire(
      const StatusBarOverride& shown, std::weak_ptr<StatusBarOverrideCoordinatorDelegate> delegate) = 0;
};

}  // namespace qv::platform
