#include <gtest/gtest.h>

#include <optional>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

/// Two pictures a second, a pause, and a stop 0.43 s after the last picture; a beep lies between these two.
class StillScreenTest : public ::testing::Test {
 protected:
  static constexpr double kBegin = 100.73;
  static constexpr double kPause = 7.11;
  /// 2 s to a pause, then to the stop.
  static constexpr double kStop = kBegin + 2 + 1.43;
  void SetUp() override {
    double offset = 0;
    for (uint32_t i = 0; i < 7; ++i) {
      if (i == 4) offset = kPause;
      const double time = kBegin + i / 2.0;
      if (i > 0) sound(time - 0.5 + (i == 4 ? 0 : offset), 22050);
      // The first picture of the second part is shown at the time at which the pause began.
      recording_.appendPicture(picture(i, time + offset, time));
      if (i != 4) continue;
      sound(kBegin + 5, 44100);  // of the pause
      sound(0, 1024);            // a filler without a time
    }
    sound(kBegin + 3 + kPause, 44100 * 43 / 100);
    sound(kStop + kPause, 44100);  // what the source delivers after the stop
  }
  void sound(double captureTime, int64_t frames) {
    recording_.appendSound(1, beepingSound(captureTime, frames));
    recording_.appendSound(2, beepingSound(captureTime, frames * 480 / 441, {48000, 1, true, false, 0.5}));
  }
  ProbedMovie finish(std::optional<double> end) {
    if (end) recording_.writer().endSessionAtSourceTime(at(*end));
    recording_.finish();
    auto movie = probeGood(path_);
    EXPECT_EQ(movie.tracks.size(), 3u);
    return movie;
  }

  kit::ScratchFolder scratch_;
  ffmpeg::FFmpegAssetWriterService service_;
  const std::string path_ = scratch_ / "movie.mp4";
  RecordingUnderTest recording_{service_, path_};
};

TEST_F(StillScreenTest, LastsUntilTheStopWithAllSoundBeforeIt) {
  for (const auto& track : finish(kStop).tracks) EXPECT_NEAR(track.duration, 3.43, 1.0 / 44100) << track.type;
  EXPECT_EQ(decodePictures(path_).size(), 7u);
  // By capture time: at 101, 102, 110 and 111.
  for (const int track : {0, 1}) expectBeeps(path_, track, {0.27, 1.27, 110 - kPause - kBegin, 111 - kPause - kBegin});
}

/// What the last picture lasts is kept by whatever is made of the movie.
TEST_F(StillScreenTest, IsExportedInItsWholeLength) {
  finish(kStop);
  ffmpeg::FFmpegExportService exports;
  for (const ExportPreset preset : {ExportPreset::PassThrough, ExportPreset::HighestQuality}) {
    const std::string copy = scratch_ / "copy.mp4";
    const double start = preset == ExportPreset::PassThrough ? 2.2 : 0;
    runToEnd(*sessionFor(exports, path_, copy, preset,
                         start > 0 ? MediaTimeRange{at(start), at(3.43 - start)} : MediaTimeRange{}));
    const auto movie = probeGood(copy);
    for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, 3.43 - start, 1e-3) << track.type;
  }
}

struct End {
  const char* name;
  std::optional<double> end;
  double duration;
  size_t pictures;
};
class EndsOfStillScreens : public StillScreenTest, public ::testing::WithParamInterface<End> {};
INSTANTIATE_TEST_SUITE_P(, EndsOfStillScreens,
                         ::testing::Values(
                             // 4 ms after a picture, which is less than a frame.
                             End{"WhereTheNextMovieBegins", 100.73 + 2.504, 2.504, 6},
                             End{"WithTheLastSoundWhereNoneIsTold", std::nullopt, 4.43, 7},
                             End{"NotBeforeTheFirstPictureWhichLastsAFrame", 95, 1 / 60.0, 1}),
                         [](const auto& end) { return end.param.name; });

TEST_P(EndsOfStillScreens, AreOfPictureAndSound) {
  for (const auto& track : finish(GetParam().end).tracks)
    EXPECT_NEAR(track.duration, GetParam().duration, 2.0 / 44100) << track.type;
  EXPECT_EQ(decodePictures(path_).size(), GetParam().pictures);
}

}  // namespace
}  // namespace qv::platform::test
