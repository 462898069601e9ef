#pragma once

#include <atomic>
#include <deque>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <variant>

#include "platform/IPC.h"
#include "platform/sdbus/BusCoding.h"
#include "platform/sdbus/InterfaceTable.h"
#include "platform/sdbus/SdBusIPC.h"

namespace qv::platform::sdbus {

struct OutgoingCall {
  uint64_t id = 0;
  std::shared_ptr<const InterfaceTable> table;  ///< to which `operation` belongs
  const IPCOperation* operation = nullptr;
  IPCArguments arguments;
  bool expectsReply = false;
};
struct OutgoingAnswer {
  uint64_t token = 0;  ///< of the received call
  IPCArguments values;
};
struct OutgoingError {
  uint64_t token = 0;
  std::string name;
  std::string message;
};
using OutgoingMessage = std::variant<OutgoingCall, OutgoingAnswer, OutgoingError>;

/// What is to be sent over one connection, in its order and within the bounds of SdBusIPCOptions.
///
/// A message counts until `settle` says that the kernel has it, so that the bounds hold for sd-bus's own queue too,
/// which counts no bytes. Where the peer does not keep up, media messages are dropped: by the bytes that wait, and by
/// the calls that the peer has not answered. Control messages never are; at their bound the peer is given up.
///
/// Threading: thread-safe.
class Outbox {
 public:
  explicit Outbox(const SdBusIPCOptions& bounds) : bounds_(bounds) {}

  struct Release {
    void operator()(std::atomic<size_t>* count) const { --*count; }
  };
  /// Held until the peer has answered a media message, or cannot any more. Not to outlive the outbox.
  using Slot = std::unique_ptr<std::atomic<size_t>, Release>;

  /// Nothing where a media message of this cost is to be dropped; the slot is empty for one that is not answered.
  [[nodiscard]] std::optional<Slot> admitMedia(const MessageCost& cost, bool expectsReply);
  /// False at the bound of all: the peer does not read.
  [[nodiscard]] bool push(OutgoingMessage message, const MessageCost& cost);

  [[nodiscard]] bool nextHasDescriptors() const;
  [[nodiscard]] std::optional<OutgoingMessage> next();
  /// The kernel has all that `next` gave out. Whether there was any since the last time.
  bool settle();
  void clear();

 private:
  struct Entry {
    OutgoingMessage message;
    size_t bytes;
    bool isMedia;
    bool hasDescriptors;
  };
  struct Bytes {
    size_t all = 0;
    size_t media = 0;  ///< of it
  };

  const SdBusIPCOptions bounds_;
  std::atomic<size_t> frames_{0};
  std::atomic<size_t> mediaCalls_{0};
  mutable std::mutex mutex_;
  // Guarded by mutex_:
  std::deque<Entry> entries_;
  Bytes queued_;
  Bytes sent_;  ///< of `queued_`: what sd-bus may still hold
};

}  // namespace qv::platform::sdbus
