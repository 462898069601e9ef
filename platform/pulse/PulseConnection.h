#pragma once

#include <pulse/pulseaudio.h>

#include <functional>
#include <memory>
#include <string>

namespace qv::platform {

struct PulseDeleter {
  void operator()(pa_threaded_mainloop* loop) const { pa_threaded_mainloop_free(loop); }
  void operator()(pa_mainloop* loop) const { pa_mainloop_free(loop); }
  void operator()(pa_context* context) const;
  void operator()(pa_proplist* properties) const { pa_proplist_free(properties); }
};
template <typename T>
using PulsePointer = std::unique_ptr<T, PulseDeleter>;

/// A context that presents itself to the server as this service.
PulsePointer<pa_context> makePulseContext(pa_mainloop_api* api);
/// For a call whose outcome comes in a callback.
inline void dropOperation(pa_operation* operation) {
  if (operation != nullptr) pa_operation_unref(operation);
}

/// A connection to the sound server for as long as it lives: made anew, a second later, whenever it
/// is lost or there is no server.
///
/// Threading: `ready`, `lost` and `scheduled` functions are called on the connection's thread, and
/// so may use its context. The destructor, on any other thread, calls `lost` there once more and waits.
class PulseConnection {
 public:
  struct Events {
    std::function<void(pa_context*)> ready;
    std::function<void()> lost;  ///< let go of everything of the context; it is still valid
  };
  /// An empty `server` is the default one. `Events` are called from construction on.
  PulseConnection(std::string server, Events events);
  ~PulseConnection();
  PulseConnection(const PulseConnection&) = delete;
  PulseConnection& operator=(const PulseConnection&) = delete;

  /// On the connection's thread: calls `ready` again in a second, if still connected then.
  void retryLater() { schedule(); }

 private:
  void connect();
  void disconnect();
  void schedule();
  void contextChanged();
  void timerFired();

  const std::string server_;
  const Events events_;
  const PulsePointer<pa_threaded_mainloop> loop_;
  PulsePointer<pa_context> context_;
  pa_time_event* timer_ = nullptr;
};

}  // namespace qv::platform
