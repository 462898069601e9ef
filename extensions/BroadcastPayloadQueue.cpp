#include "extensions/BroadcastPayloadQueue.h"

#include <algorithm>
#include <utility>

namespace qv {

using Kind = BroadcastPayload::Kind;

BroadcastPayloadQueue::Items BroadcastPayloadQueue::push(Item item) {
  Items dropped;
  const Kind kind = item.payload.kind;
  items_.push_back(std::move(item));
  if (kind == Kind::Video) {
    for (; count(kind) > kMaximumFrames; ++droppedFrames_) dropOldest(kind, dropped);
  } else if (kind != Kind::Control) {
    for (; seconds(kind) > kMaximumAudioSeconds; ++droppedAudio_) dropOldest(kind, dropped);
  }
  return dropped;
}

std::optional<BroadcastPayloadQueue::Item> BroadcastPayloadQueue::pop() {
  if (items_.empty()) return std::nullopt;
  Item item = std::move(items_.front());
  items_.pop_front();
  return item;
}

void BroadcastPayloadQueue::dropOldest(Kind kind, Items& dropped) {
  const auto oldest =
      std::find_if(items_.begin(), items_.end(), [kind](const Item& item) { return item.payload.kind == kind; });
  dropped.push_back(std::move(*oldest));
  items_.erase(oldest);
}

size_t BroadcastPayloadQueue::count(Kind kind) const {
  return static_cast<size_t>(
      std::count_if(items_.begin(), items_.end(), [kind](const Item& item) { return item.payload.kind == kind; }));
}

double BroadcastPayloadQueue::seconds(Kind kind) const {
  double sum = 0;
  for (const Item& item : items_) {
    if (item.payload.kind == kind) sum += item.payload.duration;
  }
  return sum;
}

}  // namespace qv
