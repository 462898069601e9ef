#include <gtest/gtest.h>

#include <filesystem>
#include <random>
#include <sstream>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/MovieReader.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "platform/mp4/MovieTrack.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int kCuts = 40;
#else
constexpr int kCuts = 200;
#endif
constexpr int kCutsPerPlayer = 20;  // most of a player's time for such a movie is its start
constexpr double kRate = 60;
constexpr double kLargestLoss = 1.0;  // seconds

/// When the last picture ends that lies whole before `size`.
class WrittenPictures {
 public:
  explicit WrittenPictures(const std::string& path) {
    std::istringstream lines(
        run("ffprobe -v error -select_streams v:0 -show_entries packet=pts_time,size,pos -of csv=p=0 '" + path + "'"));
    double time = 0;
    uint64_t size = 0;
    uint64_t position = 0;
    char comma = 0;
    while (lines >> time >> comma >> size >> comma >> position) ends_.emplace_back(position + size, time + 1 / kRate);
  }
  [[nodiscard]] size_t count() const { return ends_.size(); }
  [[nodiscard]] double before(uint64_t size) const {
    double end = 0;
    for (const auto& [offset, time] : ends_) end = offset <= size ? time : end;
    return end;
  }

 private:
  std::vector<std::pair<uint64_t, double>> ends_;
};

class SalvageTest : public ::testing::Test {
 protected:
  /// A file as a crash of the daemon leaves it, up to its last fragment.
  void recordAndCrash(uint32_t pictures) {
    ffmpeg::FFmpegAssetWriterService service;
    RecordingUnderTest recording(service, path_, 160, 90);
    for (uint32_t i = 0; i < pictures; ++i) {
      recording.appendPicture(picture(i, i / kRate, i / kRate, 160, 90));
      recording.appendSound(1, beepingSound(i / kRate, 735));
      recording.appendSound(2, beepingSound(i / kRate, 800, {48000, 1, true, false, 0.5}));
    }
    recording.drop();
  }
  std::string cutAt(uint64_t size) {
    const std::string copy = scratch_ / ("cut" + std::to_string(size) + ".mp4");
    std::filesystem::copy_file(path_, copy, std::filesystem::copy_options::overwrite_existing);
    std::filesystem::resize_file(copy, size);
    return copy;
  }
  /// What one player says of all of them.
  static std::string play(const std::vector<std::string>& movies) {
    std::string command = "ffmpeg -v error -nostdin";
    for (const auto& movie : movies) command += " -i '" + movie + "'";
    for (size_t i = 0; i < movies.size(); ++i) command += " -map " + std::to_string(i);
    return run(command + " -f null - 2>&1");
  }
  static double durationOf(const std::string& movie) {
    const auto reader = ffmpeg::MovieReader::open(movie, nullptr);
    return reader ? static_cast<double>(reader.value()->duration()) / mp4::kMovieTimescale : 0;
  }

  kit::ScratchFolder scratch_;
  const std::string path_ = scratch_ / "growing.mp4";
  mp4::MP4MovieSalvage salvage_;
};

/// Cut at any byte, a growing movie that is salvaged plays without a complaint and has lost a second at most.
TEST_F(SalvageTest, AnyCutPlaysAndLosesASecondAtMost) {
  recordAndCrash(300);
  const WrittenPictures written(path_);
  ASSERT_GE(written.count(), 240u);
  const auto size = std::filesystem::file_size(path_);
  std::mt19937_64 random(3);
  int salvaged = 0;
  std::vector<std::string> movies;
  for (int cut = 1; cut <= kCuts; ++cut) {
    const uint64_t at = random() % (size + 1);
    const std::string movie = cutAt(at);
    const auto length = salvage_.salvageMovie(movie);
    const double kept = length ? length.value().seconds() : 0;
    EXPECT_LE(written.before(at) - kept, kLargestLoss) << "cut at " << at;
    if (kept > 0) {
      ++salvaged;
      EXPECT_NEAR(durationOf(movie), kept, 1e-3) << "cut at " << at;
      movies.push_back(movie);
    } else {
      EXPECT_EQ(std::filesystem::file_size(movie), at) << "what cannot be salvaged is left as it was";
      std::filesystem::remove(movie);
    }
    if (movies.size() < kCutsPerPlayer && cut < kCuts) continue;
    EXPECT_EQ(play(movies), "");
    for (const auto& played : std::exchange(movies, {})) std::filesystem::remove(played);
  }
  // The others fell into the first fragment, which has the largest key frame, or before it.
  EXPECT_GT(salvaged, kCuts / 2);
}

TEST_F(SalvageTest, KeepsEveryPictureOfTheWholeFragmentsAndTheSound) {
  recordAndCrash(300);
  const std::string movie = cutAt(std::filesystem::file_size(path_) - 1);
  const auto length = salvage_.salvageMovie(movie);
  ASSERT_TRUE(length);
  const auto pictures = decodePictures(movie);
  ASSERT_GE(pictures.size(), 180u);
  for (uint32_t i = 0; i < pictures.size(); ++i) {
    EXPECT_EQ(pictures[i].number, i);
    EXPECT_NEAR(pictures[i].time, i / kRate, 1e-5);
  }
  const auto heard = beeps(decodeSound(movie, 0));
  ASSERT_GE(heard.size(), 3u);
  for (size_t i = 0; i < heard.size(); ++i) EXPECT_NEAR(heard[i], static_cast<double>(i), 0.001);
  // A second time changes nothing.
  const auto size = std::filesystem::file_size(movie);
  EXPECT_FALSE(salvage_.salvageMovie(movie).value().isValid());
  EXPECT_EQ(std::filesystem::file_size(movie), size);
}

}  // namespace
}  // namespace qv::platform::test
