#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "MainLoop.h"

namespace comet {

/// How long the flash shows and the beep sounds, from each whole second on.
inline constexpr Instant kFlashDuration = std::chrono::milliseconds(100);

/// Whether the flash shows, and the beep is heard, at `instant`.
inline bool isFlash(Instant instant) { return instant % std::chrono::seconds(1) < kFlashDuration; }

/// Draws the game at `instant` into BGRX `pixels` of width x height: comets and sparks over a drifting
/// sky and a ground that runs by, as lively as a game is for an encoder; during a flash a white field
/// over half the picture. `sky`: 0xRRGGBB in place of sky and ground.
void drawScene(std::span<uint32_t> pixels, uint32_t width, uint32_t height, Instant instant, bool flash,
               std::optional<uint32_t> sky = std::nullopt);

/// Draws `number` (its lower 16 bits) along the lower edge, for a program to read: 24 cells from left to right, white
/// for 1 and black for 0, highest bit first; the last eight are the exclusive or of the two bytes and 0xA5. Cells
/// are a twentieth of the picture high.
void drawNumber(std::span<uint32_t> pixels, uint32_t width, uint32_t height, uint32_t number);

}  // namespace comet
