#include <atomic>
#include <utility>

#include "platform/sdbus/BusErrors.h"
#include "platform/sdbus/BusLink.h"

namespace qv::platform::sdbus {
namespace {

/// The right to answer one received call. A call that nobody answers fails when this goes.
///
/// Threading: thread-safe.
class CallAnswer final : public IPCReply::Sink {
 public:
  CallAnswer(std::weak_ptr<BusLink> link, uint64_t token) : link_(std::move(link)), token_(token) {}
  ~CallAnswer() override { CallAnswer::fail(kNoReplyError, "the call was not answered"); }

  void succeed(IPCArguments values) override {
    if (answered_.exchange(true)) return;
    if (const auto link = link_.lock()) link->answer(OutgoingAnswer{token_, std::move(values)});
  }
  void fail(std::string errorName, std::string message) override {
    if (answered_.exchange(true)) return;
    if (sd_bus_interface_name_is_valid(errorName.c_str()) <= 0) errorName = SD_BUS_ERROR_FAILED;
    if (const auto link = link_.lock()) link->answer(OutgoingError{token_, std::move(errorName), std::move(message)});
  }

 private:
  const std::weak_ptr<BusLink> link_;
  const uint64_t token_;
  std::atomic<bool> answered_{false};
};

}  // namespace

void BusLink::driverReceivedCall(std::shared_ptr<const InterfaceTable> table, const IPCOperation& operation,
                                 IPCArguments arguments, uint64_t token) {
  const size_t bytes = costOf(arguments).bytes;
  std::shared_ptr<CallAnswer> answer;
  if (token != 0) answer = std::make_shared<CallAnswer>(weak_from_this(), token);
  std::lock_guard lock(mutex_);
  if (ended_) return;
  // The table keeps the operation; the arguments go when the handler has run, or cannot run.
  deliver(
      [owner = owner_, table = std::move(table), &operation, arguments = std::move(arguments),
       answer = std::move(answer)]() mutable {
        const auto strong = owner.lock();
        if (!strong) return;
        const bool handsReply = operation.reply && answer;
        strong->linkReceivedCall(table->name(), operation, std::move(arguments),
                                 handsReply ? IPCReply(answer) : IPCReply());
        // Whoever asks for an answer to a one-way operation learns that it was handled.
        if (answer && !operation.reply) answer->succeed({});
        answer.reset();
      },
      bytes);
}

/// The one end of a call that the peer answered; a call that ended with its link stays ended.
void BusLink::driverEndedCall(uint64_t id, std::variant<IPCArguments, Error> outcome) {
  decltype(calls_)::node_type ended;  // let go of without the lock
  std::lock_guard lock(mutex_);
  ended = calls_.extract(id);
  if (!ended) return;
  PendingCall& call = ended.mapped();
  if (auto* values = std::get_if<IPCArguments>(&outcome)) {
    if (!call.completion) return;
    const size_t bytes = costOf(*values).bytes;
    deliver([completion = std::move(call.completion), arguments = std::move(*values)] { completion(arguments); },
            bytes);
  } else if (call.errorHandler) {
    deliver([handler = std::move(call.errorHandler), error = std::get<Error>(std::move(outcome))] { handler(error); },
            0);
  }
}

void BusLink::driverSentCall(uint64_t id) {
  decltype(calls_)::node_type sent;  // let go of without the lock
  std::lock_guard lock(mutex_);
  sent = calls_.extract(id);
}

void BusLink::driverLostPeer() {
  std::lock_guard lock(mutex_);
  endLocked(End::Lost);
}

/// Queues work that a message caused, and counts it until it has run.
void BusLink::deliver(std::function<void()> work, size_t bytes) {
  driver_->backlog().add(bytes);
  queue_->async([driver = driver_, work = std::move(work), bytes]() mutable {
    work();
    work = nullptr;
    if (driver->backlog().remove(bytes)) driver->readSoon();
  });
}

}  // namespace qv::platform::sdbus
