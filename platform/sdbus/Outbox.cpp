#include "platform/sdbus/Outbox.h"

#include <utility>

namespace qv::platform::sdbus {
namespace {

constexpr size_t kHeaderBytes = 256;  // about what sd-bus adds to a message

Outbox::Slot take(std::atomic<size_t>& count) {
  ++count;
  return Outbox::Slot(&count);
}

}  // namespace

std::optional<Outbox::Slot> Outbox::admitMedia(const MessageCost& cost, bool expectsReply) {
  const bool isFrame = cost.descriptors > 0;
  if (isFrame && frames_ >= bounds_.maximumFramesInFlight) return std::nullopt;
  if (!isFrame && expectsReply && mediaCalls_ >= bounds_.maximumMediaCallsInFlight) return std::nullopt;
  {
    std::lock_guard lock(mutex_);
    // A message larger than the bound still passes when nothing else waits.
    if (queued_.media > 0 && queued_.media + cost.bytes > bounds_.maximumQueuedMediaBytes) return std::nullopt;
  }
  if (isFrame) return take(frames_);
  if (expectsReply) return take(mediaCalls_);
  return Slot();
}

bool Outbox::push(OutgoingMessage message, const MessageCost& cost) {
  const auto* call = std::get_if<OutgoingCall>(&message);
  const bool isMedia = call && call->operation->isMedia;
  const size_t bytes = cost.bytes + kHeaderBytes;
  std::lock_guard lock(mutex_);
  if (queued_.all + bytes > bounds_.maximumQueuedBytes) return false;
  queued_.all += bytes;
  if (isMedia) queued_.media += bytes;
  entries_.push_back({std::move(message), bytes, isMedia, cost.descriptors > 0});
  return true;
}

bool Outbox::nextHasDescriptors() const {
  std::lock_guard lock(mutex_);
  return !entries_.empty() && entries_.front().hasDescriptors;
}

std::optional<OutgoingMessage> Outbox::next() {
  std::lock_guard lock(mutex_);
  if (entries_.empty()) return std::nullopt;
  Entry entry = std::move(entries_.front());
  entries_.pop_front();
  sent_.all += entry.bytes;
  if (entry.isMedia) sent_.media += entry.bytes;
  return std::move(entry.message);
}

bool Outbox::settle() {
  std::lock_guard lock(mutex_);
  const Bytes sent = std::exchange(sent_, {});
  queued_.all -= sent.all;
  queued_.media -= sent.media;
  return sent.all > 0;
}

void Outbox::clear() {
  std::deque<Entry> dropped;
  std::lock_guard lock(mutex_);
  dropped.swap(entries_);
  queued_ = sent_;
}

}  // namespace qv::platform::sdbus
