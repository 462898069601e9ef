#pragma once

#include <span>

#include "platform/base/Result.h"
#include "platform/base/Value.h"

namespace qv {

/// The settings of a broadcast: the length of its movie clips and video compression settings that
/// are laid over the movie writer's defaults.
///
/// It crosses process boundaries as a keyed archive whose root class is "QVBroadcastConfiguration",
/// with the keys "clipDuration" (number, seconds; 0 when absent) and "videoCompressionProperties"
/// (dictionary; absent when empty).
///
/// Threading: a value.
struct QVBroadcastConfiguration {
  /// Larger archives are refused.
  static constexpr size_t kMaximumArchiveSize = 1 << 20;
  static constexpr double kDefaultClipDuration = 5.0;
  /// Shorter clips are mostly overhead, longer ones mostly disk. Seconds.
  static constexpr double kShortestClipDuration = 0.5;
  static constexpr double kLongestClipDuration = 600.0;

  double clipDuration = 0;
  platform::Dictionary videoCompressionProperties;

  bool operator==(const QVBroadcastConfiguration&) const = default;
  [[nodiscard]] platform::Data encode() const;
  static platform::Result<QVBroadcastConfiguration> decode(std::span<const uint8_t> archive);
  /// Of another process: also fails for an archive that is too large and for a clip duration that is negative or no
  /// finite number.
  static platform::Result<QVBroadcastConfiguration> decodeReceived(std::span<const uint8_t> archive);
  /// Seconds from one cut to the next: within the bounds, and the default where none is set.
  [[nodiscard]] double effectiveClipDuration() const;
};

}  // namespace qv
