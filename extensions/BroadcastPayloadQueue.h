#pragma once

#include <cstdint>
#include <deque>
#include <optional>
#include <vector>

#include "extensions/PayloadAnswer.h"
#include "platform/base/Value.h"
#include "protocol/QVSharedFrameObject.h"

namespace qv {

/// One payload for a broadcast extension: the entries of its kind (QVBroadcastProtocols.h).
struct BroadcastPayload {
  enum class Kind { Control, Video, AppAudio, Microphone };
  Kind kind = Kind::Control;
  platform::Dictionary entries;
  /// Of a video payload. It gets its wire form, and so its lease, only when it is sent.
  QVSharedFrameObject frame = {};
  /// Of an audio payload, in seconds.
  double duration = 0;
};

/// The payloads that wait for an extension which is not quick enough, in their order.
///
/// It is bounded: the newest 8 frames, and the newest 2 s of each kind of sound. So frames go first and sound is kept
/// longer. Control payloads (actions, the application in front) are never dropped; they are few.
///
/// Threading: none of its own.
class BroadcastPayloadQueue {
 public:
  struct Item {
    BroadcastPayload payload;
    PayloadAnswerRef answer;
  };
  using Items = std::vector<Item>;
  static constexpr size_t kMaximumFrames = 8;
  static constexpr double kMaximumAudioSeconds = 2.0;

  /// What had to make way: its answers are the caller's to give up.
  [[nodiscard]] Items push(Item item);
  std::optional<Item> pop();
  [[nodiscard]] uint64_t droppedFrames() const { return droppedFrames_; }
  [[nodiscard]] uint64_t droppedAudio() const { return droppedAudio_; }

 private:
  /// There is one.
  void dropOldest(BroadcastPayload::Kind kind, Items& dropped);
  [[nodiscard]] size_t count(BroadcastPayload::Kind kind) const;
  [[nodiscard]] double seconds(BroadcastPayload::Kind kind) const;

  std::deque<Item> items_;
  uint64_t droppedFrames_ = 0;
  uint64_t droppedAudio_ = 0;
};

}  // namespace qv
