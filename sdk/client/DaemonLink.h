#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>

#include "platform/IPC.h"
#include "platform/threads/SerialQueue.h"
#include "platform/threads/Timer.h"
#include "protocol/Calls.h"
#include "sdk/client/quorvel/Recorder.h"

namespace qv::client {

/// The connection to the daemon: made when a request needs it, lost at most once, made anew.
///
/// Every call with a completion ends exactly once, in it or in its failure handler. After a loss the
/// link stays down until the next call, or, while `setKeepsConnected` is on, tries again by itself
/// with growing pauses. A daemon that takes connections and drops them at once counts as not there:
/// the pauses are short again only after it has answered, or has stayed for a while.
///
/// Threading: on its queue only, which its callbacks run on too.
class DaemonLink : public std::enable_shared_from_this<DaemonLink> {
 public:
  struct Interfaces {
    const platform::IPCInterface& remote;                    ///< the one that is called; it outlives the link
    std::shared_ptr<platform::IPCExportedObject> callbacks;  ///< what the daemon calls; nothing where it calls nothing
  };
  struct Delegate {
    /// A connection stands: the first one, or one after a loss.
    std::function<void()> connected;
    /// The connection is gone, and every outstanding call has failed.
    std::function<void()> lost;
  };
  using Completion = std::function<void(const platform::IPCArguments&)>;
  using FailureHandler = std::function<void(quorvel::Error)>;

  static constexpr std::chrono::milliseconds kFirstRetry{250};
  static constexpr std::chrono::milliseconds kLongestRetry{30'000};

  DaemonLink(platform::IPCService& ipc, platform::TimerService& timers, std::shared_ptr<platform::SerialQueue> queue,
             Interfaces interfaces, Delegate delegate);

  /// For an operation with a reply; `completion` gets as many values as the operation's table says.
  void request(OutgoingCall call, Completion completion, FailureHandler onFailure);
  /// For an operation without one.
  void send(OutgoingCall call, FailureHandler onFailure);
  void setKeepsConnected(bool keep);
  /// Ends the connection without a word; nothing is called any more.
  void close();

 private:
  bool ensureConnected();
  void lose(uint64_t generation);
  void tryAgainLater();
  void endRequest(uint64_t identifier, const std::function<void(const FailureHandler&)>& end);

  platform::IPCService& ipc_;
  platform::TimerService& timers_;
  const std::shared_ptr<platform::SerialQueue> queue_;
  const Interfaces interfaces_;
  const Delegate delegate_;
  std::shared_ptr<platform::IPCConnection> connection_;
  uint64_t generation_ = 0;  // of the connection, so that a late word of a former one is known
  bool keepsConnected_ = false, closed_ = false;
  std::chrono::milliseconds nextRetry_ = kFirstRetry;
  std::chrono::steady_clock::time_point connectedSince_;
  std::unique_ptr<platform::TimerHandle> retry_;
  std::map<uint64_t, FailureHandler> outstanding_;
  uint64_t lastRequest_ = 0;
};

}  // namespace qv::client
