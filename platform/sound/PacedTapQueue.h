#pragma once

#include "platform/AppAudioTap.h"
#include "platform/sound/PCMSource.h"

namespace qv::platform {

/// Statuses of the tap queues.
inline constexpr int32_t kTapNoProcess = -1;     ///< started, or set, without a process
inline constexpr int32_t kTapNoSuchBuffer = -2;  ///< not this queue's, or in the queue already
inline constexpr int32_t kTapFormatUnsupported = -3;
inline constexpr int32_t kTapDisposed = -4;
inline constexpr int32_t kTapNotAvailable = -5;  ///< the source could not be opened
inline constexpr int32_t kTapBadSize = -6;       ///< a buffer of no whole frame, or of over 1 MiB

/// Opens the sound of one process; nothing where that fails.
using TapSourceFactory = std::function<std::unique_ptr<PCMSource>(pid_t process, const PCMFormat& format)>;

/// Tap queues over any source of sound: the buffers, their circulation and the running property.
///
/// A partly filled buffer is handed over after 1024 frames while at least six buffers, itself
/// included, stand in the queue: so little is lost at a stop, and a user who is slow to give
/// buffers back gets full ones instead of running out.
///
/// Threading: thread-safe. The factory is called in the thread that starts a queue.
class PacedTapService final : public AppAudioTapService {
 public:
  /// `clock` is the host clock.
  explicit PacedTapService(TapSourceFactory factory, PacedClock& clock = monotonicClock())
      : factory_(std::move(factory)), clock_(clock) {}
  int32_t createInputQueue(const AudioStreamDescription& format, AppAudioInputCallback callback, uint32_t flags,
                           std::unique_ptr<AppAudioTapQueue>& queue) override;

 private:
  const TapSourceFactory factory_;
  PacedClock& clock_;
};

}  // namespace qv::platform
