#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <fstream>
#include <random>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/MoviesLoader.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

constexpr double kSourceStart = 500.0;
constexpr uint32_t kSourcePictures = 240;  // 8 s at 30 per second

/// One movie with numbered pictures, beeps on the seconds in one track and off them in the other.
class ExportTest : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    scratch_ = new kit::ScratchFolder;
    source_ = *scratch_ / "source.mp4";
    ffmpeg::FFmpegAssetWriterService writers;
    RecordingUnderTest recording(writers, source_, 320, 180, {0, 1, -1, 0, 0, 0});
    for (uint32_t i = 0; i < kSourcePictures; ++i) {
      const double now = kSourceStart + i / 30.0;
      recording.appendPicture(picture(i, now, now));
      recording.appendSound(1, beepingSound(now, 1470));
      if (i >= 15) recording.appendSound(2, beepingSound(now, 1470, {44100, 1, true, false, 0.25}));
    }
    recording.finish();
  }
  static void TearDownTestSuite() { delete scratch_; }

  void run(const std::string& source, const std::string& destination, ExportPreset preset,
           const MediaTimeRange& range = {}, ExportStatus wanted = ExportStatus::Completed) {
    runToEnd(*sessionFor(service_, source, destination, preset, range), wanted);
  }
  static size_t filesIn(const std::string& directory) {
    return static_cast<size_t>(std::distance(std::filesystem::directory_iterator(directory), {}));
  }

  static inline kit::ScratchFolder* scratch_ = nullptr;
  static inline std::string source_;
  ffmpeg::FFmpegExportService service_;
  kit::ScratchFolder results_;
};

TEST_F(ExportTest, OpensAMovie) {
  const auto movie = service_.openMovie(URL::fileURL(source_));
  EXPECT_DOUBLE_EQ(movie->duration().seconds(), 8.0);
  EXPECT_EQ(movie->audioTrackIDs(), (std::vector<int32_t>{2, 3}));
}

TEST_F(ExportTest, TrimsToTheFrameAndTheBeep) {
  std::mt19937 random(7);
  for (int round = 0; round < 8; ++round) {
    const uint32_t first = random() % 200;
    const uint32_t count = 20 + random() % (kSourcePictures - first - 20);
    const std::string path = results_ / ("trim" + std::to_string(round) + ".mp4");
    run(source_, path, ExportPreset::PassThrough, {MediaTime::make(first, 30), MediaTime::make(count, 30)});
    const auto movie = probeGood(path);
    ASSERT_EQ(movie.tracks.size(), 3u);
    EXPECT_EQ(movie.tracks[0].rotation, -90);
    for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, count / 30.0, 1e-4);
    expectPictures(path, first, count, 30);
    for (int track = 0; track < 2; ++track) {
      for (const double beep : beeps(decodeSound(path, track))) {
        const double inSource = beep + first / 30.0;
        // The range may begin inside a beep.
        if (beep <= 0.01) continue;
        EXPECT_NEAR(inSource, std::round(inSource), 0.001) << "track " << track;
      }
    }
  }
}

/// A range that begins and ends between pictures: the one shown there is shown from the start, none too early.
TEST_F(ExportTest, TrimsBetweenPictures) {
  const std::string path = results_ / "between.mp4";
  // 2.0033 s, a tenth into picture 60.
  run(source_, path, ExportPreset::PassThrough, {MediaTime::make(601, 300), MediaTime::make(900, 300)});
  const auto movie = probeGood(path);
  EXPECT_NEAR(movie.duration, 3.0, 1e-4);
  const auto pictures = decodePictures(path);
  ASSERT_EQ(pictures.size(), 91u);
  for (uint32_t i = 0; i < 91; ++i) {
    EXPECT_EQ(pictures[i].number, 60 + i);
    EXPECT_NEAR(pictures[i].time, i == 0 ? 0 : i / 30.0 - 1 / 300.0, 1e-4);
  }
}

TEST_F(ExportTest, MixesTracksAtTheirLevelsAndCopiesThePicture) {
  const std::string path = results_ / "mix.mp4";
  auto mix = sessionFor(service_, source_, path, ExportPreset::HighestQuality);
  mix->setAudioMix({{2}, {3}});
  runToEnd(*mix);

  const auto movie = probeGood(path);
  ASSERT_EQ(movie.tracks.size(), 2u);
  EXPECT_EQ(movie.tracks[0].rotation, -90);
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, 8.0, 1e-4);
  EXPECT_EQ(decodePictures(path).size(), kSourcePictures);
  const auto sound = decodeSound(path, 0);
  const auto heard = beeps(sound);
  ASSERT_EQ(heard.size(), 8u);
  // The second track joins after half a second: the first beep is the first track's alone.
  const auto levelAt = [&](double time) {
    float peak = 0;
    for (auto i = static_cast<size_t>((time + 0.01) * 44100); i < static_cast<size_t>((time + 0.04) * 44100); ++i) {
      peak = std::max(peak, std::abs(sound[i]));
    }
    return peak;
  };
  EXPECT_NEAR(levelAt(0), 0.5, 0.03);
  for (int second = 1; second < 8; ++second) {
    EXPECT_NEAR(heard[static_cast<size_t>(second)], second, 0.001);
    EXPECT_NEAR(levelAt(second), 0.75, 0.04);
  }
}

TEST_F(ExportTest, EncodesOtherCodecsAnewAndLeavesOutMissingSound) {
  const std::string other = results_ / "mpeg4.mp4";
  test::run("ffmpeg -v error -nostdin -i '" + source_ + "' -an -c:v mpeg4 -q:v 2 '" + other + "'");
  run(other, results_ / "pass.mp4", ExportPreset::PassThrough, {}, ExportStatus::Failed);
  const std::string path = results_ / "encoded.mp4";
  run(other, path, ExportPreset::HighestQuality);
  const auto movie = probeGood(path);
  ASSERT_EQ(movie.tracks.size(), 1u);
  EXPECT_EQ(movie.tracks[0].codec, "h264");
  EXPECT_EQ(decodePictures(path).size(), kSourcePictures);
}

TEST_F(ExportTest, FailsWithoutLeavingAnything) {
  std::filesystem::copy(source_, results_ / "short.mp4");
  // A movie whose header stands in front, cut off in the middle of its media.
  test::run("ffmpeg -v error -nostdin -i '" + source_ + "' -map 0 -c copy -movflags +faststart '" +
            (results_ / "front.mp4") + "'");
  for (const char* name : {"short.mp4", "front.mp4"}) {
    std::filesystem::resize_file(results_ / name, std::filesystem::file_size(results_ / name) / 2);
  }
  std::ofstream(results_ / "empty.mp4");
  std::ofstream(results_ / "text.mp4") << "no movie";
  // A list of other files is no movie, whatever the library could make of it.
  std::ofstream(results_ / "list.mp4") << "#EXTM3U\n#EXT-X-TARGETDURATION:8\n#EXTINF:8,\nfile:" << source_
                                       << "\n#EXT-X-ENDLIST\n";
  std::filesystem::create_directory(results_ / "directory.mp4");
  const size_t before = filesIn(results_.path());
  const std::string output = results_ / "output.mp4";
  for (const auto preset : {ExportPreset::PassThrough, ExportPreset::HighestQuality}) {
    for (const char* name :
         {"short.mp4", "front.mp4", "empty.mp4", "text.mp4", "list.mp4", "directory.mp4", "missing.mp4"}) {
      const auto bad = sessionFor(service_, results_ / name, output, preset);
      runToEnd(*bad, ExportStatus::Failed);
      EXPECT_TRUE(bad->error().has_value()) << name;
    }
    for (const char* name : {"text.mp4", "empty.mp4", "missing.mp4"}) {
      const auto nothing = service_.openMovie(URL::fileURL(results_ / name));
      EXPECT_TRUE(nothing->duration().seconds() == 0 && nothing->audioTrackIDs().empty()) << name;
    }
    const MediaTime second = MediaTime::make(1, 1);
    const MediaTimeRange ranges[] = {{MediaTime::make(-1, 1), second},
                                     {second, MediaTime::make(-1, 1)},
                                     {second, MediaTime::make(8, 1)},
                                     {MediaTime::make(9, 1), second},
                                     {MediaTime::fromSeconds(std::nan(""), 1), second},
                                     {MediaTime::fromSeconds(-INFINITY, 1), second},
                                     {second, MediaTime::fromSeconds(1e300, 1)},
                                     {MediaTime::make(INT64_MAX, 1), MediaTime::make(INT64_MAX, 1)},
                                     {second, MediaTime::zero()}};
    for (const auto& range : ranges) run(source_, output, preset, range, ExportStatus::Failed);
    const auto cancelled = sessionFor(service_, source_, output, preset);
    cancelled->cancel();
    runToEnd(*cancelled, ExportStatus::Cancelled);
    run(source_, results_ / "no/such/output.mp4", preset, {}, ExportStatus::Failed);
  }
  EXPECT_EQ(filesIn(results_.path()), before);
}

/// Movies that are unusual but good: each is trimmed and mixed whole, whatever it lacks.
TEST_F(ExportTest, TakesMoviesWithoutATrackAndWithOddTimes) {
  struct Case {
    const char* name;
    const char* options;
    size_t tracks, mixedTracks;
    double duration;
  };
  const Case cases[] = {
      {"silent.mp4", "-map 0:v -c copy", 1, 1, 8},
      {"sound.mp4", "-map 0:a -c copy", 2, 1, 8},
      {"one.mp4", "-map 0:a:0 -c copy", 1, 1, 8},
      {"late.mp4", "-map 0:v -map 0:a:0 -c copy -output_ts_offset 2.5 -avoid_negative_ts disabled", 2, 2, 10.5},
      {"uneven.mp4", "-map 0:v -c:v libx264 -bf 2 -vf select='mod(n\\,7)' -fps_mode vfr -video_track_timescale 1001", 1,
       1, 8},
  };
  for (const Case& odd : cases) {
    const std::string source = results_ / odd.name;
    test::run("ffmpeg -v error -nostdin -i '" + source_ + "' " + odd.options + " '" + source + "'");
    for (const auto preset : {ExportPreset::PassThrough, ExportPreset::HighestQuality}) {
      const std::string path = results_ / "output.mp4";
      run(source, path, preset);
      const auto movie = probeGood(path);
      EXPECT_EQ(movie.tracks.size(), preset == ExportPreset::PassThrough ? odd.tracks : odd.mixedTracks) << odd.name;
      EXPECT_NEAR(movie.duration, odd.duration, 0.05) << odd.name;
      run(source, path, preset, {MediaTime::make(27, 10), MediaTime::make(41, 10)});
      EXPECT_NEAR(probeGood(path).duration, 4.1, 0.05) << odd.name;
    }
  }
}

TEST_F(ExportTest, LoadsModulesOnFirstUseAndReportsMissingOnes) {
  ffmpeg::MoviesLoader loader(QV_MOVIE_MODULES);
  EXPECT_EQ(loader.openMovie(URL::fileURL(source_))->duration().seconds(), 8.0);
  const std::string path = results_ / "recorded.mp4";
  RecordingUnderTest recording(loader, path);
  recording.appendPictures(30, 30, kSourceStart);
  recording.finish();
  EXPECT_EQ(probe(path).errors, "");

  ffmpeg::MoviesLoader missing(results_ / "none");
  EXPECT_FALSE(missing.createAssetWriter(URL::fileURL(results_ / "x.mp4"), kFileTypeMPEG4).hasValue());
  auto failing = missing.createExportSession(missing.openMovie(URL::fileURL(source_)), ExportPreset::PassThrough);
  runToEnd(*failing, ExportStatus::Failed);
}

}  // namespace
}  // namespace qv::platform::test
