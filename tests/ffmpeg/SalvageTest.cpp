#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <filesystem>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

/// Wherever a growing movie with real media is cut behind its first fragment: players show what was salvaged without a
/// complaint, every picture and beep in its place, and no more than a second is lost.
TEST(SalvageTest, PlaysFromItsBeginningToASecondBeforeTheCut) {
  constexpr double kRate = 60;
  constexpr uint32_t kPictures = 300;
  const kit::ScratchFolder scratch;
  const std::string path = scratch / "growing.mp4", movie = scratch / "cut.mp4";
  ffmpeg::FFmpegAssetWriterService service;
  RecordingUnderTest recording(service, path, 160, 90);
  for (uint32_t i = 0; i < kPictures; ++i) {
    recording.appendPicture(picture(i, i / kRate, i / kRate, 160, 90));
    recording.appendSound(1, beepingSound(i / kRate, 735));
    recording.appendSound(2, beepingSound(i / kRate, 800, {48000, 1, true, false, 0.5}));
  }
  recording.drop();
  const auto written = packetsOfPictures(path);
  const auto size = std::filesystem::file_size(path);
  for (const size_t part : {40, 57, 74, 91, 100}) {
    SCOPED_TRACE(part);
    const uint64_t cut = size * part / 100;
    std::filesystem::copy_file(path, movie, std::filesystem::copy_options::overwrite_existing);
    std::filesystem::resize_file(movie, cut);
    auto length = mp4::MP4MovieSalvage().salvageMovie(movie);
    ASSERT_TRUE(length);
    EXPECT_NEAR(probeGood(movie).duration, length->seconds(), 1e-3);
    const auto whole = std::ranges::count_if(written, [&](const auto& p) { return p.offset + p.size <= cut; });
    const auto shown = decodePictures(movie).size();
    EXPECT_GE(shown + kRate, whole);
    expectPictures(movie, 0, static_cast<uint32_t>(shown), kRate);
    for (const int track : {0, 1}) {
      const auto heard = beeps(decodeSound(movie, track));
      EXPECT_GE(heard.size(), std::floor(shown / kRate));
      for (size_t i = 0; i < heard.size(); ++i) EXPECT_NEAR(heard[i], static_cast<double>(i), 0.001);
    }
  }
}

}  // namespace
}  // namespace qv::platform::test
