#pragma once

namespace qv::platform {

/// A claim on the status bar: while it lives, the bar shows what it was acquired for. For a device that
/// has a status bar; no backend here has one.
///
/// Threading: main queue.
class StatusBarOverrideAssertion {
 public:
  virtual ~StatusBarOverrideAssertion() = default;
};

/// Gets what the user does with an overridden status bar.
///
/// Threading: called on the main queue.
class StatusBarOverrideCoordinatorDelegate {
 public:
  virtual ~StatusBarOverrideCoordinatorDelegate() = default;
};

/// Sees to it that the claims of several processes on the status bar do not cover each other.
///
/// Threading: main queue.
class StatusBarOverrideCoordinator {
 public:
  virtual ~StatusBarOverrideCoordinator() = default;
};

}  // namespace qv::platform
