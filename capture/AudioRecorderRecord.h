#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <optional>

#include "platform/AppAudioTap.h"

namespace qv {

inline constexpr size_t kTapBufferCount = 10;

/// One running app-audio tap. The platform's callbacks hold it weakly, so that a late one never
/// reaches a stopped tap.
///
/// Threading: audio dispatch queue only.
struct AudioRecorderRecord {
  std::unique_ptr<platform::AppAudioTapQueue> queue;
  /// First the requested format, then the one that the queue reports.
  platform::AudioStreamDescription dataFormat;
  std::array<platform::QueueBuffer*, kTapBufferCount> buffers{};
  uint32_t bufferByteSize = 0;
  int64_t currentPacket = 0;  ///< packets received since the start
  bool isRunning = false;
  std::optional<int32_t> stopStatus;  ///< once the queue was told to stop
};

/// The size of one tap buffer: `seconds` of audio, 57344 bytes at most.
uint32_t computeBufferByteSize(platform::AppAudioTapQueue& queue, const platform::AudioStreamDescription& format,
                               double seconds);

}  // namespace qv
