#pragma once

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/IPC.h"
#include "platform/sdbus/GatedInput.h"
#include "platform/sdbus/IPCContext.h"
#include "platform/threads/CallbackGate.h"

namespace qv::platform::sdbus {

/// The part of a listener that the I/O thread and the delegate's queue hold.
///
/// Threading: thread-safe; the delegate is called through the gate, so that no call is in progress when the listener or
/// its delegate has been taken away. `mutex` is never held during a call: the I/O thread waits for no delegate.
struct ListenerState : std::enable_shared_from_this<ListenerState> {
  ListenerState(std::shared_ptr<IPCContext> sharedContext, IPCListener& owner)
      : context(std::move(sharedContext)), listener(&owner) {}

  void start(FileDescriptor openedSocket, bool rendezvous);
  void stop();

  const std::shared_ptr<IPCContext> context;
  CallbackGate gate;
  std::mutex mutex;
  // Guarded by mutex:
  IPCListener* listener;
  IPCListenerDelegate* delegate = nullptr;
  std::shared_ptr<SerialQueue> queue;

 private:
  void acceptAll();
  void acceptOne(FileDescriptor connected);
  [[nodiscard]] std::optional<PeerGuard> admit(uid_t user);
  [[nodiscard]] FileDescriptor acceptNext(bool& isEmpty);
  bool refuseOne();  ///< false where nobody waits
  void offer(const std::shared_ptr<IPCConnection>& connection);

  // I/O thread:
  FileDescriptor socket_;
  bool isRendezvous_ = false;
  EventLoop::Watch watch_;
  FileDescriptor spare_;  ///< given up for a moment to refuse a connection when descriptors ran out
  std::shared_ptr<std::atomic<size_t>> connections_ = std::make_shared<std::atomic<size_t>>(0);
};

/// Listens under a service name, or anonymously.
///
/// Threading: thread-safe. `invalidate` waits for a call of the delegate in progress (unless called
/// from it).
class SdBusIPCListener final : public IPCListener {
 public:
  /// `path` is empty for an anonymous listener.
  SdBusIPCListener(std::shared_ptr<IPCContext> context, std::string path);
  ~SdBusIPCListener() override;

  void setDelegate(IPCListenerDelegate* delegate, SerialQueue& queue) override;
  std::optional<Error> resume() override;
  void invalidate() override;
  [[nodiscard]] ListenerEndpoint endpoint() const override;

 private:
  std::optional<Error> resumeNamed();

  const std::string path_;
  const std::shared_ptr<ListenerState> state_;
  mutable std::mutex mutex_;
  bool isOpen_ = false;
  FileDescriptor lock_;        ///< of a socket file that is ours
  FileDescriptor rendezvous_;  ///< our end, until `resume`
  SharedFileDescriptor endpoint_;
};

}  // namespace qv::platform::sdbus
