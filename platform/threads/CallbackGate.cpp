#include "platform/threads/CallbackGate.h"

namespace qv::platform {

CallbackGate::Time CallbackGate::open() {
  std::lock_guard lock(mutex_);
  isOpen_ = true;
  changed_.notify_all();
  return ++lastTime_;
}

void CallbackGate::close(Time time) {
  std::unique_lock lock(mutex_);
  if (!isOver(time)) isOpen_ = false;
  changed_.notify_all();
  changed_.wait(lock, [this] { return isMine(); });
}

void CallbackGate::awaitIdle() {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [this] { return isMine(); });
}

bool CallbackGate::begin(Time time) {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [&] { return isOver(time) || isMine(); });
  if (isOver(time)) return false;
  caller_ = std::this_thread::get_id();
  ++depth_;
  return true;
}

bool CallbackGate::leave(Time time) {
  std::lock_guard lock(mutex_);
  if (--depth_ == 0) changed_.notify_all();
  return !isOver(time);
}

}  // namespace qv::platform
