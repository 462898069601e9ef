#pragma once

#include <cstdint>
#include <optional>
#include <span>

/// What the headless device shows and plays, so that a test can judge a recording of it.
///
/// Everything follows the host clock (CLOCK_MONOTONIC, nanoseconds); no origin has to be agreed on.
///
/// The picture is divided into a grid of 16 columns and 9 rows; column c begins at the pixel
/// floor(c * width / 16), row r at floor(r * height / 9). On a dark ground (no channel above 64) stand
/// - the frame number: the 8 x 5 cells at columns 1 to 8, rows 1 to 5, row by row, each white for 1
///   and black for 0. The first 32 are the bits of the number, highest first; the last 8 are a
///   check: the exclusive or of the number's four bytes and kCheckMask;
/// - the flash: the 5 x 5 cells at columns 10 to 14, rows 1 to 5, white in frames whose
///   presentation time lies in the first 100 ms of a whole second, dark otherwise;
/// - a bar of half a cell in row 7 that crosses the picture from left to right every 4 seconds.
///
/// So a reader who takes the mean of the middle of each cell, and calls it white above 127, is not
/// bothered by scaling (cells are 16 pixels or more from 256 x 144 on) or by lossy coding.
///
/// Numbers count the frames that one controller has delivered, from 0, also across a stop and a
/// new start.
///
/// The sound is silence but for a beep in the first 100 ms of each whole second: a sine, beginning at
/// phase 0 with the second, of kAppBeepFrequency in what applications play and kMicrophoneBeepFrequency
/// at the microphone, on all channels. A beep thus begins at the same host time as a flash; the
/// first frame that shows the flash is up to one frame interval later.
namespace qv::platform::testsignal {

inline constexpr uint32_t kGridColumns = 16;
inline constexpr uint32_t kGridRows = 9;
inline constexpr uint8_t kCheckMask = 0xA5;

inline constexpr uint64_t kPeriod = 1'000'000'000;       ///< nanoseconds from one flash to the next
inline constexpr uint64_t kFlashDuration = 100'000'000;  ///< nanoseconds, of a beep as well
inline constexpr double kAppBeepFrequency = 1000;        ///< Hz
inline constexpr double kMicrophoneBeepFrequency = 440;  ///< Hz
inline constexpr double kBeepAmplitude = 16384;          ///< of 32768

/// A picture to read: interleaved B, G, R, X bytes, or a plane of 8-bit luma.
struct Picture {
  enum class Format { BGRX, Luma8 };
  std::span<const uint8_t> bytes;
  uint32_t width = 0;
  uint32_t height = 0;
  uint32_t stride = 0;  ///< bytes per row
  Format format = Format::BGRX;
};

/// Pixels of columns [x0, x1) and rows [y0, y1).
struct PixelRect {
  uint32_t x0 = 0, y0 = 0, x1 = 0, y1 = 0;
};
/// Where grid cells stand in a picture of a size.
PixelRect gridRect(uint32_t column, uint32_t row, uint32_t columns, uint32_t rows, uint32_t width, uint32_t height);

/// The 40 cells of a number, the first one in bit 39.
uint64_t encodeFrameNumber(uint32_t number);
/// The picture's number; nothing where the check fails, as it does for any plain picture.
std::optional<uint32_t> decodeFrameNumber(const Picture& picture);
/// Whether the picture shows the flash.
bool decodeFlash(const Picture& picture);

/// Whether a frame of this host time shows the flash.
constexpr bool isFlashTime(uint64_t hostTime) { return hostTime % kPeriod < kFlashDuration; }
/// The sound at a host time.
int16_t beepSample(uint64_t hostTime, double frequency);

}  // namespace qv::platform::testsignal
