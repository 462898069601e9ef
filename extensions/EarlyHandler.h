#pragma once

#include <functional>
#include <mutex>
#include <optional>
#include <utility>

namespace qv {

/// A handler that may be set later than the first of what it is told. Until then the latest waits for it.
///
/// Threading: thread-safe; the handler runs within `tell` and `tellWaiting`, without a lock.
template <typename T>
class EarlyHandler {
 public:
  using Handler = std::function<void(const T&)>;

  /// Whoever sets it has to see to `tellWaiting`, where the handler may run.
  void set(Handler handler) {
    std::lock_guard lock(mutex_);
    if (!isClosed_) handler_.swap(handler);
  }
  void tell(T value) {
    {
      std::lock_guard lock(mutex_);
      if (isClosed_) return;
      waiting_ = std::move(value);
    }
    tellWaiting();
  }
  void tellWaiting() {
    Handler handler;
    std::optional<T> value;
    {
      std::lock_guard lock(mutex_);
      if (!handler_ || !waiting_) return;
      handler = handler_;
      value.swap(waiting_);
    }
    handler(*value);
  }
  /// Lets go of the handler, for good.
  void close() {
    Handler handler;
    std::lock_guard lock(mutex_);
    handler.swap(handler_);
    waiting_.reset();
    isClosed_ = true;
  }

 private:
  std::mutex mutex_;
  Handler handler_;
  std::optional<T> waiting_;
  bool isClosed_ = false;
};

}  // namespace qv
