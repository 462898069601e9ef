#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <vector>

#include "platform/base/Geometry.h"

namespace qv::platform::mp4 {

/// Ticks per second of the movie header, its edit lists, and a recording's video track: 60, 50, 30,
/// 25 and 24 frames per second are whole numbers of ticks.
inline constexpr uint32_t kMovieTimescale = 90000;

/// The display matrix of a track header: 16.16 fixed point, the third column 2.30.
using DisplayMatrix = std::array<int32_t, 9>;
inline constexpr DisplayMatrix kIdentityMatrix = {0x10000, 0, 0, 0, 0x10000, 0, 0, 0, 0x40000000};
/// The matrix of `transform`, moved so that the transformed picture of this size begins at the origin.
DisplayMatrix displayMatrix(const AffineTransform& transform, uint32_t width, uint32_t height);

/// Code points of ISO/IEC 23091-2, as in the stream's own headers.
struct ColorDescription {
  uint16_t primaries = 1;  ///< BT.709, which are sRGB's too
  uint16_t transfer = 1;   ///< BT.709
  uint16_t matrix = 6;     ///< BT.601
  bool fullRange = false;
};

/// What stands in the movie's header about a track.
struct MovieTrack {
  enum class Kind { Video, Audio };
  uint32_t trackID = 1;
  Kind kind = Kind::Video;
  /// Ticks per second of its samples' times.
  uint32_t timescale = kMovieTimescale;
  /// The media time at which its presentation begins: the encoder's priming, or where a cut is.
  int64_t mediaStart = 0;
  /// How long before that the movie shows nothing of the track, in kMovieTimescale.
  uint64_t startDelay = 0;
  uint32_t width = 0;
  uint32_t height = 0;
  DisplayMatrix matrix = kIdentityMatrix;
  /// The whole sample entry box ("avc1" or "mp4a").
  std::vector<uint8_t> sampleEntry;
};

/// `avcC` is the content of the decoder configuration box.
std::vector<uint8_t> makeAVCSampleEntry(uint32_t width, uint32_t height, std::span<const uint8_t> avcC,
                                        const ColorDescription& color);
/// `config` is the AudioSpecificConfig.
std::vector<uint8_t> makeAACSampleEntry(uint32_t sampleRate, uint32_t channels, uint32_t bitRate,
                                        std::span<const uint8_t> config);

/// One encoded picture or AAC packet; times in its track's timescale.
struct EncodedSample {
  std::vector<uint8_t> data;
  int64_t decodeTime = 0;
  int32_t compositionOffset = 0;
  /// How long it lasts if no later sample says otherwise by its decode time.
  uint32_t duration = 0;
  bool isSync = true;
};

}  // namespace qv::platform::mp4
