#pragma once

#include <cstdint>
#include <span>

#include "MainLoop.h"

namespace comet {

/// How long the flash shows and the beep sounds, from each whole second on.
inline constexpr Instant kFlashDuration = std::chrono::milliseconds(100);

/// Whether the flash shows, and the beep is heard, at `instant`.
inline bool isFlash(Instant instant) { return instant % std::chrono::seconds(1) < kFlashDuration; }

/// Draws the game at `instant` into BGRX `pixels` of width x height: comets over a night sky, and a
/// white field over half the picture during a flash.
void drawScene(std::span<uint32_t> pixels, uint32_t width, uint32_t height, Instant instant, bool flash);

}  // namespace comet
