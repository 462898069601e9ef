#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <vector>

#include "platform/mp4/MovieTrack.h"
#include "platform/mp4/MovieWriter.h"
#include "tests/mp4/MovieLayout.h"

namespace qv::platform::mp4 {

using Fragment = std::vector<std::vector<EncodedSample>>;

inline EncodedSample sample(size_t size, int64_t time, uint32_t duration, bool isSync = true) {
  return {std::vector<uint8_t>(size, static_cast<uint8_t>(size)), time, 0, duration, isSync};
}

inline std::vector<MovieTrack> tracks() {
  MovieTrack picture;
  picture.width = 64;
  picture.height = 36;
  picture.matrix = displayMatrix({0, -1, -1, 0, 0, 0}, 64, 36);
  picture.sampleEntry = makeAVCSampleEntry(64, 36, std::vector<uint8_t>{1, 2, 3, 4}, {1, 13, 6, true});
  MovieTrack sound;
  sound.trackID = 2;
  sound.kind = MovieTrack::Kind::Audio;
  sound.timescale = 48000;
  sound.mediaStart = 1024;
  sound.sampleEntry = makeAACSampleEntry(48000, 2, 128000, std::vector<uint8_t>{0x11, 0x90});
  return {picture, sound};
}
/// Regular and not, begun by a key frame and not, with sound and without.
inline std::vector<Fragment> media() {
  return {{{sample(5, 0, 3000), sample(3, 3000, 3000, false), sample(4, 6000, 3000)},
           {sample(2, 0, 1024), sample(2, 1024, 1024)}},
          {{sample(6, 9000, 6000, false), sample(1, 15000, 4000, false)}, {sample(3, 2048, 1024)}},
          {{sample(2, 19000, 3000), sample(1, 22000, 3000, false)}, {}},
          {{sample(7, 25000, 5000)}, {}}};
}
/// The movie of the first fragments: as a crash leaves it, or finished.
inline std::vector<uint8_t> movieOf(size_t fragments, bool isFinished) {
  Disk disk;
  MovieWriter writer(std::make_unique<MemoryFile>(disk), tracks(), MovieWriter::Layout::Fragmented);
  EXPECT_FALSE(writer.writeHeader());
  for (size_t i = 0; i < fragments; ++i) EXPECT_FALSE(writer.writeFragment(media()[i]));
  EXPECT_FALSE(isFinished && writer.finish({}));
  return disk.bytes;
}

}  // namespace qv::platform::mp4
