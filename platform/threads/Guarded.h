#pragma once

#include <mutex>
#include <utility>

namespace qv::platform {

/// A value that cannot be touched without its lock.
///
/// Threading: thread-safe.
template <typename T>
class Guarded {
 public:
  Guarded() = default;
  explicit Guarded(T value) : value_(std::move(value)) {}

  [[nodiscard]] T load() const {
    std::lock_guard lock(mutex_);
    return value_;
  }
  /// The former value is destroyed after the lock is released.
  void store(T value) {
    std::lock_guard lock(mutex_);
    std::swap(value_, value);
  }
  [[nodiscard]] T exchange(T value) {
    std::lock_guard lock(mutex_);
    std::swap(value_, value);
    return value;
  }
  template <typename Work>
  auto with(Work&& work) {
    std::lock_guard lock(mutex_);
    return work(value_);
  }

 private:
  mutable std::mutex mutex_;
  T value_{};
};

}  // namespace qv::platform
