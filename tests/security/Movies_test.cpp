#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <random>
#include <set>
#include <sstream>

#include "platform/mp4/MP4MovieSalvage.h"
#include "support/QVUnfinishedMovies.h"
#include "tests/daemon/DaemonTest.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"
#include "tests/movies/PatientMovies.h"

namespace qv {
namespace {

namespace mp4 = platform::mp4;
using platform::test::RecordingUnderTest;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr unsigned kDamagedMovies = 40;
#else
constexpr unsigned kDamagedMovies = 200;
#endif
constexpr double kRate = 60;
constexpr uint32_t kPictures = 411;
constexpr uint64_t kPlaceholder = 40, kPlaceholderSize = 16;  // of a movie that is being written

uint32_t numberAt(const std::string& bytes, uint64_t offset) {
  uint32_t number = 0;
  for (uint64_t i = 0; i < 4; ++i) number = number << 8 | static_cast<uint8_t>(bytes.at(offset + i));
  return number;
}

/// Where one fragment of a movie lies.
struct FragmentPlace {
  uint64_t begin, mediaBegin, end;
  [[nodiscard]] bool holds(uint64_t offset) const { return offset >= begin && offset < end; }
};
std::vector<FragmentPlace> fragmentsOf(const std::string& movie) {
  std::vector<FragmentPlace> fragments;
  for (uint64_t at = 0; at < movie.size(); at += numberAt(movie, at)) {
    if (movie.compare(at + 4, 4, "moof") == 0) fragments.push_back({at, 0, 0});
    if (movie.compare(at + 4, 4, "mdat") != 0) continue;
    fragments.back().mediaBegin = at + 8;
    fragments.back().end = at + numberAt(movie, at);
  }
  return fragments;
}

/// Offset and size of every coded picture that another reader finds in a movie.
std::set<std::pair<uint64_t, uint64_t>> picturesIn(const std::string& path) {
  std::istringstream lines(platform::test::run(
      "ffprobe -v quiet -select_streams v:0 -show_entries packet=size,pos -of csv=p=0 '" + path + "'"));
  std::set<std::pair<uint64_t, uint64_t>> pictures;
  uint64_t size = 0, offset = 0;
  char comma = 0;
  while (lines >> size >> comma >> offset) pictures.insert({offset, size});
  return pictures;
}

/// A movie that a crash left, damaged and left in the store.
class DamagedMoviesTest : public testing::Test {
 protected:
  DamagedMoviesTest() { device_.platform.deviceRoot = device_.disk.at(""); }
  std::string record(bool isFinished) {
    platform::ffmpeg::FFmpegAssetWriterService service;
    const std::string path = scratch_ / (isFinished ? "finished.mp4" : "crashed.mp4");
    RecordingUnderTest recording(service, path, 160, 90);
    for (uint32_t i = 0; i < kPictures; ++i) {
      recording.appendPicture(platform::test::picture(i, i / kRate, i / kRate, 160, 90));
      recording.appendSound(1, platform::test::beepingSound(i / kRate, 735));
    }
    isFinished ? recording.finish() : recording.drop();
    return scratch_.read(isFinished ? "/finished.mp4" : "/crashed.mp4");
  }
  void leaveInStore(const std::string& name, const std::string& movie) { device_.disk.addFile(store_ + name, movie); }
  void salvageStore() {
    const auto movies =
        QVUnfinishedMovies(device_.files, salvage_, *device_.platform.localization)._srSalvageUnfinishedMovies();
    EXPECT_TRUE(movies);
  }
  /// By the beginning of its name; empty where it is gone.
  std::string keptPath(const std::string& stem) {
    const auto names = device_.disk.contentsOfDirectory(store_);
    for (const std::string& name : names.value()) {
      if (name == stem + ".mp4" || name.starts_with(stem + "_recovered_")) return store_ + name;
    }
    return {};
  }
  static std::string contentOf(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), {});
  }

  kit::ScratchFolder scratch_;
  fakes::FakeDevice device_;
  const std::string store_ = device_.disk.at(fakes::kStore) + "/";
  mp4::MP4MovieSalvage salvage_;
};

std::string withFlippedBit(std::string movie, uint64_t offset, unsigned bit) {
  movie.at(offset) = static_cast<char>(movie[offset] ^ (1 << bit));
  return movie;
}

TEST_F(DamagedMoviesTest, NoneIsGoneAndEachPictureOfAnUndamagedFragmentIsThere) {
  const std::string movie = record(false);
  const auto fragments = fragmentsOf(movie);
  ASSERT_GE(fragments.size(), 5u);
  const auto pictures = picturesIn(scratch_ / "crashed.mp4");
  ASSERT_GE(pictures.size(), kPictures - 60);
  std::vector<uint64_t> places;
  for (unsigned seed = 0; seed < kDamagedMovies; ++seed) {
    std::mt19937 random(seed);
    const FragmentPlace& at = fragments[random() % fragments.size()];
    const bool isInHeader = seed % 4 == 0;
    places.push_back(isInHeader ? random() % fragments.front().begin
                                : at.begin + random() % (at.mediaBegin - at.begin));
    leaveInStore("Movie " + std::to_string(seed) + ".mp4", withFlippedBit(movie, places.back(), random() % 8));
  }
  salvageStore();
  for (unsigned seed = 0; seed < kDamagedMovies; ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed) + ", byte " + std::to_string(places[seed]));
    const std::string path = keptPath("Movie " + std::to_string(seed));
    ASSERT_FALSE(path.empty());
    std::mt19937 random(seed);
    (void)random(), (void)random();
    const std::string damaged = withFlippedBit(movie, places[seed], random() % 8);
    std::string kept = contentOf(path).substr(0, damaged.size());
    kept.replace(kPlaceholder, kPlaceholderSize, damaged, kPlaceholder, kPlaceholderSize);
    EXPECT_EQ(kept.compare(damaged), 0) << "something was taken away";
    if (places[seed] < fragments.front().begin) continue;
    EXPECT_EQ(salvage_.stateOfMovie(path).value(), platform::MovieState::Finished);
    const auto found = picturesIn(path);
    for (const auto& picture : pictures) {
      const bool isDamaged = std::ranges::any_of(fragments, [&](const FragmentPlace& fragment) {
        return fragment.holds(places[seed]) && fragment.holds(picture.first);
      });
      EXPECT_TRUE(isDamaged || found.contains(picture)) << "picture at " << picture.first;
    }
  }
}

TEST_F(DamagedMoviesTest, ABrokenHeadCostsNoPictureWhoseDataIsWhole) {
  const std::string movie = record(false);
  const auto fragments = fragmentsOf(movie);
  const size_t whole = platform::test::decodePictures(scratch_ / "crashed.mp4").size();
  for (const size_t number : {size_t{0}, fragments.size() / 2, fragments.size() - 1}) {
    // Of the head its size and type, and the type of the media behind it.
    for (const uint64_t at :
         {fragments[number].begin + 2, fragments[number].begin + 5, fragments[number].mediaBegin - 3}) {
      SCOPED_TRACE("byte " + std::to_string(at));
      leaveInStore("Chess.mp4", withFlippedBit(movie, at, 4));
      salvageStore();
      const std::string path = keptPath("Chess");
      const auto shown = platform::test::decodePictures(path);
      EXPECT_EQ(shown.size(), whole);
      for (size_t i = 0; i < shown.size(); ++i) {
        ASSERT_EQ(shown[i].number, i);
        ASSERT_NEAR(shown[i].time, static_cast<double>(i) / kRate, 1e-4);
      }
      std::filesystem::remove(path);
    }
  }
}

TEST_F(DamagedMoviesTest, ADamagedTimeMovesNothingElse) {
  const std::string movie = record(false);
  const auto fragments = fragmentsOf(movie);
  const size_t whole = platform::test::decodePictures(scratch_ / "crashed.mp4").size();
  const uint64_t time = movie.find("tfdt", fragments[2].begin) + 8;
  for (const uint64_t byte : {time + 2, time + 4, time + 6}) {
    leaveInStore("Chess.mp4", withFlippedBit(movie, byte, 3));
    salvageStore();
    const auto shown = platform::test::decodePictures(keptPath("Chess"));
    ASSERT_EQ(shown.size(), whole) << byte - time;
    EXPECT_NEAR(shown.back().time, static_cast<double>(whole - 1) / kRate, 0.02) << byte - time;
    std::filesystem::remove(keptPath("Chess"));
  }
}

TEST_F(DamagedMoviesTest, AFinishedMovieIsLeftAloneWhateverElseIsOdd) {
  const std::string movie = record(true);
  for (uint64_t at = 0; at < kPlaceholder + kPlaceholderSize; ++at) {
    leaveInStore("Movie " + std::to_string(at) + ".mp4", withFlippedBit(movie, at, at % 8));
  }
  salvageStore();
  for (uint64_t at = 0; at < kPlaceholder + kPlaceholderSize; ++at) {
    const std::string path = store_ + "Movie " + std::to_string(at) + ".mp4";
    EXPECT_EQ(contentOf(path), withFlippedBit(movie, at, at % 8)) << at;
  }
  // Only the step behind the index was missing.
  std::string almost = movie;
  almost.replace(kPlaceholder, kPlaceholderSize,
                 std::string("\0\0\0\x10"
                             "free\0\0\0\0\0\0\0\0",
                             kPlaceholderSize));
  leaveInStore("Almost.mp4", almost);
  salvageStore();
  EXPECT_EQ(contentOf(keptPath("Almost")), movie);
}

TEST_F(DamagedMoviesTest, OnlyWhatNeverHadMediaGoes) {
  const std::string movie = record(false);
  const uint64_t header = fragmentsOf(movie).front().begin;
  leaveInStore("Empty.mp4", {});
  leaveInStore("Header.mp4", movie.substr(0, header));
  leaveInStore("Torn.mp4", movie.substr(0, header + 1000));
  leaveInStore("Text.mp4", "moof");
  salvageStore();
  EXPECT_EQ(keptPath("Empty"), "");
  EXPECT_EQ(keptPath("Header"), "");
  EXPECT_EQ(contentOf(keptPath("Torn")).substr(0, header + 1000).substr(kPlaceholder + kPlaceholderSize),
            movie.substr(kPlaceholder + kPlaceholderSize, header + 1000 - kPlaceholder - kPlaceholderSize));
  EXPECT_TRUE(keptPath("Text").find("_recovered_") != std::string::npos);
}

/// Where a disk fails at the stop.
enum class Step { IndexWrite, IndexSync, HeadWrite, Close };
struct Fault {
  Step step;
  int errnum;
  int64_t code;
};
class FaultyFile final : public mp4::MovieFile {
 public:
  FaultyFile(std::unique_ptr<mp4::MovieFile> file, Fault fault) : file_(std::move(file)), fault_(fault) {}
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) override {
    const bool isIndex = bytes.size() > 8 && std::memcmp(bytes.data() + 4, "moov", 4) == 0;
    sawIndex_ = sawIndex_ || isIndex;
    if ((isIndex && fault_.step == Step::IndexWrite) || (offset == kPlaceholder && fault_.step == Step::HeadWrite))
      return -fault_.errnum;
    return file_->writeAt(bytes, offset);
  }
  int truncate(uint64_t size) override { return file_->truncate(size); }
  int sync() override { return sawIndex_ && fault_.step == Step::IndexSync ? fault_.errnum : file_->sync(); }
  int close() override {
    const int failure = file_->close();
    return fault_.step == Step::Close ? fault_.errnum : failure;
  }

 private:
  std::unique_ptr<mp4::MovieFile> file_;
  const Fault fault_;
  bool sawIndex_ = false;
};

/// The daemon with the real writer on a real folder.
class MovieLossTest : public QuietDaemonTest, public testing::WithParamInterface<Fault> {
 protected:
  static constexpr uint32_t kSent = 30;
  MovieLossTest() : client_(game()) {
    device_.platform.deviceRoot = device_.disk.at("");
    device_.platform.movieSalvage = &salvage_;
  }
  void record(platform::test::PatientMovies& movies) {
    device_.platform.assetWriter = &movies;
    ASSERT_EQ(client_.start()->code(), 0);
    for (uint32_t i = 0; i < kSent; ++i) {
      const auto time = platform::MediaTime::make(kSecond + i * kSecond / 60, platform::kHostTimescale);
      device_.screen.last().send(platform::SampleBuffer::makeVideo(platform::test::numberedPicture(i, 160, 90), time,
                                                                   platform::MediaTime::invalid()));
      device_.run();
    }
  }
  TestClient::Answer stop(platform::test::PatientMovies& movies) {
    client_.send("stopRecordingWithHandler");
    movies.waitForFinish();
    device_.run();
    return client_.answer().value();
  }

  TestClient client_;
  const std::string store_ = device_.disk.at(fakes::kStore);
  const std::string path_ = store_ + "/Game.mp4";
  mp4::MP4MovieSalvage salvage_;
};

TEST_P(MovieLossTest, AtTheStopIsToldWithTheMovieUpToThen) {
  platform::test::PatientMovies movies(
      path_, [](const std::string& path) -> platform::Result<std::unique_ptr<mp4::MovieFile>> {
        auto file = mp4::DiskMovieFile::create(path);
        return std::unique_ptr<mp4::MovieFile>(std::make_unique<FaultyFile>(std::move(*file), GetParam()));
      });
  record(movies);
  const auto answer = stop(movies);
  EXPECT_EQ(answer.code(1), GetParam().code);
  EXPECT_EQ(platform::URL(answer.values[0].asString()).path(), path_);
  EXPECT_EQ(platform::test::decodePictures(path_).size(), kSent);
  EXPECT_EQ(salvage_.stateOfMovie(path_).value(), platform::MovieState::Finished) << "mended at once";
  EXPECT_EQ(device_.log.countContaining("movie finished:"), 0u);
  EXPECT_EQ(client_.request("discardRecordingWithHandler")->failure, std::nullopt) << "it is the client's";
  EXPECT_FALSE(std::filesystem::exists(path_));
}
INSTANTIATE_TEST_SUITE_P(Disk, MovieLossTest,
                         testing::Values(Fault{Step::IndexWrite, ENOSPC, errorcode::kInsufficientStorage},
                                         Fault{Step::IndexWrite, EIO, errorcode::kFailedToSave},
                                         Fault{Step::IndexSync, EIO, errorcode::kFailedToSave},
                                         Fault{Step::HeadWrite, EIO, errorcode::kFailedToSave},
                                         Fault{Step::Close, EIO, errorcode::kFailedToSave}));

using StoreLossTest = MovieLossTest;

TEST_F(StoreLossTest, ARemovedStoreHasNoMovieAndIsMadeAgain) {
  for (const bool isMadeAgain : {false, true}) {
    platform::test::PatientMovies movies(path_);
    record(movies);
    std::filesystem::remove_all(store_);
    if (isMadeAgain) device_.disk.addFile(path_, "somebody else's");
    const auto answer = stop(movies);
    EXPECT_EQ(answer.code(1), errorcode::kFailedToSave);
    EXPECT_EQ(answer.values[0].asString(), "");
    EXPECT_EQ(std::filesystem::exists(path_), isMadeAgain);
  }
  EXPECT_EQ(device_.disk.readFile(path_).value(), "somebody else's");
  std::filesystem::remove_all(store_);
  device_.platform.assetWriter = &device_.movies;
  EXPECT_EQ(client_.start()->code(), 0);
  EXPECT_TRUE(std::filesystem::is_directory(store_));
}

using LossTest = QuietDaemonTest;

TEST_F(LossTest, AStoreThatCannotBeWrittenRefusesStartsWithThatReason) {
  auto client = game();
  const std::string store = std::string(fakes::kStore) + "/";
  for (const auto& [errnum, code] : {std::pair(EROFS, errorcode::kFailedToStart),
                                     {EIO, errorcode::kFailedToStart},
                                     {EDQUOT, errorcode::kInsufficientStorage},
                                     {0, int64_t{0}}}) {
    device_.disk.failOn(fakes::ScratchDisk::Operation::Write, store, errnum);
    EXPECT_EQ(client.start()->code(), code) << errnum;
  }
  EXPECT_EQ(device_.log.countContaining("movies cannot be written"), 2u);
  client.stop();
  std::filesystem::remove_all(device_.disk.at(fakes::kStore));
  device_.disk.addFile(fakes::kStore, "a plain file");
  EXPECT_EQ(client.start()->code(), errorcode::kFailedToStart);
}

/// A copy in the library would be all that is left of it, and nobody would know that it is not whole.
TEST_F(LossTest, WhatIsNotWholeStaysOutOfThePhotoLibrary) {
  auto device = systemUI();
  record(device, {.system = true});
  device_.salvage.others = platform::MovieState::Unfinished;
  auto client = game();
  client.start();
  const auto end = device.takeEnd();
  ASSERT_TRUE(end);
  EXPECT_EQ(end->code, errorcode::kInterrupted);
  EXPECT_EQ(contentAt(end->movie), "movie 0");
  EXPECT_TRUE(device_.photoLibrary.stored.empty());
}

}  // namespace
}  // namespace qv
