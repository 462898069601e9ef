#pragma once

#include <span>

#include "platform/Result.h"
#include "platform/Value.h"

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
  double clipDuration = 0;
  platform::Dictionary videoCompressionProperties;

  bool operator==(const QVBroadcastConfiguration&) const = default;
  [[nodiscard]] platform::Data encode() const;
  static platform::Result<QVBroadcastConfiguration> decode(std::span<const uint8_t> archive);
};

}  // namespace qv
