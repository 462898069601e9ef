#include <gtest/gtest.h>

#include <cmath>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"

namespace qv::platform::test {
namespace {

constexpr double kStart = 1000.25;

class AssetWriterTest : public ::testing::Test {
 protected:
  ScratchDirectory scratch_;
  ffmpeg::FFmpegAssetWriterService service_;
  const std::string path_ = scratch_ / "movie.mp4";
};

TEST_F(AssetWriterTest, WritesEveryPictureAtItsTimeAndLeavesOutASilentTrack) {
  RecordingUnderTest recording(service_, path_, 320, 180, {0, 1, -1, 0, 0, 0});
  for (uint32_t i = 0; i < 180; ++i) {
    const double now = kStart + i / 60.0;
    recording.appendPicture(picture(i, now, now));
    if (i % 6 == 0) recording.appendSound(1, beepingSound(now - 0.1, 4410));
  }
  recording.finish();
  EXPECT_EQ(recording.writer().status(), AssetWriterStatus::Completed);

  const auto movie = probe(path_);
  EXPECT_EQ(movie.errors, "");
  ASSERT_EQ(movie.tracks.size(), 2u);
  EXPECT_EQ(movie.tracks[0].profile, "High");
  EXPECT_EQ(movie.tracks[0].rotation, -90);
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, 3.0, 1e-4) << track.type;
  const auto pictures = decodePictures(path_);
  ASSERT_EQ(pictures.size(), 180u);
  for (uint32_t i = 0; i < 180; ++i) {
    EXPECT_EQ(pictures[i].number, i);
    EXPECT_NEAR(pictures[i].time, i / 60.0, 1e-5);
  }
  const auto heard = beeps(decodeSound(path_, 0));
  ASSERT_EQ(heard.size(), 3u);
  for (size_t i = 0; i < 3; ++i) EXPECT_NEAR(heard[i], std::ceil(kStart) - kStart + static_cast<double>(i), 0.001);
}

}  // namespace
}  // namespace qv::platform::test
