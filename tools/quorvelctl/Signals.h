#pragma once

namespace ctl {

/// The signals with which somebody ends this program (SIGINT, SIGTERM, SIGHUP), as something to wait for. Blocked from
/// then on, also for threads that begin later: made before any. A child gets its own mask (RecorderProcess).
///
/// Threading: one thread.
class Signals {
 public:
  Signals();
  ~Signals();
  Signals(const Signals&) = delete;
  Signals& operator=(const Signals&) = delete;

  /// Readable when one has come.
  [[nodiscard]] int descriptor() const { return descriptor_; }
  /// Waits for one; false when `milliseconds` have passed.
  [[nodiscard]] bool await(int milliseconds) const;
  /// Takes one that has come; false where none has.
  bool take() const;

 private:
  int descriptor_ = -1;
};

}  // namespace ctl
