#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <future>
#include <random>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/mp4/MovieRecorder.h"
#include "platform/mp4/Salvage.h"
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

/// A beep on each whole second of capture time outside the pauses, at its place between the pictures.
TEST_F(AssetWriterTest, KeepsSoundInPlaceAcrossPauses) {
  constexpr double kRate = 30;
  RecordingUnderTest recording(service_, path_);
  double now = 100.5;
  double offset = 0;
  uint32_t number = 0;
  std::vector<double> expected;
  double last = now;
  for (int part = 0; part < 6; ++part) {
    if (part > 0) {
      now += 3.217 + part;  // the pause
      // The frame that ends the pause repeats the time of the last one and never reaches the writer.
      offset += now - last;
      now += 1 / kRate;
      // What the tap still delivers of the pause, and a filler without a time.
      recording.appendSound(1, beepingSound(now - 1.5, 44100));
      recording.appendSound(1, beepingSound(0, 1024));
    }
    for (int i = 0; i < 70; ++i, now += 1 / kRate) {
      recording.appendPicture(picture(number++, now, now - offset));
      recording.appendSound(1, beepingSound(now, 1470));
      recording.appendSound(2, beepingSound(now, 1600, {48000, 1, true, false, 0.5}));
      const double next = std::ceil(now - 1e-9);
      // The last picture's own interval is already cut: the movie goes on from its beginning.
      if (i < 69 && next < now + 1 / kRate - 1e-9 && next >= now) expected.push_back(next - offset - 100.5);
      last = now;
    }
  }
  recording.finish();
  const auto movie = probe(path_);
  EXPECT_EQ(movie.errors, "");
  ASSERT_EQ(movie.tracks.size(), 3u);
  const double length = 420 / kRate;
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, length, 1e-3);
  const auto pictures = decodePictures(path_);
  ASSERT_EQ(pictures.size(), 420u);
  for (uint32_t i = 0; i < 420; ++i) EXPECT_EQ(pictures[i].number, i);
  for (int track = 0; track < 2; ++track) {
    const auto heard = beeps(decodeSound(path_, track));
    // A beep that a pause cut begins with the first sound after it and is no beginning of its own.
    for (const double wanted : expected) {
      const auto match =
          std::find_if(heard.begin(), heard.end(), [&](double b) { return std::abs(b - wanted) < 0.001; });
      EXPECT_NE(match, heard.end()) << "track " << track << ", beep at " << wanted;
    }
  }
}

TEST_F(AssetWriterTest, EndsAfterThePictureOfTheEndTime) {
  RecordingUnderTest recording(service_, path_);
  for (uint32_t i = 0; i < 120; ++i) {
    const double now = kStart + i / 60.0;
    recording.appendPicture(picture(i, now, now));
    recording.appendSound(1, beepingSound(now, 735));
  }
  recording.writer().endSessionAtSourceTime(at(kStart + 59 / 60.0));
  recording.finish();
  const auto movie = probe(path_);
  EXPECT_EQ(movie.errors, "");
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, 1.0, 1e-4) << track.type;
  EXPECT_EQ(decodePictures(path_).size(), 60u);
}

TEST_F(AssetWriterTest, ReadsEveryPCMFormatAtItsLevel) {
  const BeepFormat formats[] = {{44100, 1, true, false, 0.5},
                                {48000, 2, false, false, 0.5},
                                {48000, 1, false, true, 0.5},
                                {44100, 2, true, true, 0.5}};
  for (const BeepFormat& format : formats) {
    std::filesystem::remove(path_);
    RecordingUnderTest recording(service_, path_);
    const int64_t frames = format.rate / 25;
    for (uint32_t i = 0; i < 75; ++i) {
      const double now = 10 + i / 25.0;
      recording.appendPicture(picture(i, now, now));
      recording.appendSound(1, beepingSound(now, frames, format));
    }
    recording.finish();
    const auto sound = decodeSound(path_, 0);
    const auto heard = beeps(sound);
    ASSERT_EQ(heard.size(), 3u);
    for (size_t i = 0; i < 3; ++i) EXPECT_NEAR(heard[i], static_cast<double>(i), 0.001);
    const auto begin = sound.begin() + 44100 + 600;
    EXPECT_NEAR(*std::max_element(begin, begin + 1000), 0.5, 0.03);
  }
}

/// A still screen, a silent stretch, pictures of other sizes, odd sides: one movie with its times true.
TEST_F(AssetWriterTest, KeepsStillScreensOddSizesAndLongSilence) {
  RecordingUnderTest recording(service_, path_, 321, 181);
  recording.appendPicture(picture(1, 0, 0, 321, 181));
  recording.appendSound(1, beepingSound(0, 44100));
  for (uint32_t i = 1; i <= 140; ++i) recording.appendPicture(picture(i, i / 2.0, i / 2.0, i > 70 ? 90 : 321, 181));
  recording.appendSound(1, beepingSound(69, 22050));
  recording.finish();
  const auto movie = probe(path_);
  EXPECT_EQ(movie.errors, "");
  EXPECT_EQ(movie.tracks[0].width, 322);
  EXPECT_EQ(movie.tracks[0].height, 182);
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, 70.0 + 1 / 60.0, 1e-3);
  const auto pictures = decodePictures(path_);
  ASSERT_EQ(pictures.size(), 141u);
  EXPECT_EQ(pictures[60].number, 60u);
  double lastKey = 0;
  for (const auto& shown : pictures) {
    if (shown.isKey) lastKey = shown.time;
    EXPECT_LE(shown.time - lastKey, 2.5);
  }
  const auto heard = beeps(decodeSound(path_, 0));
  ASSERT_EQ(heard.size(), 2u);
  EXPECT_NEAR(heard[1], 69.0, 0.001);
}

/// Cut anywhere, the growing file plays; salvaged, it has lost a second at most.
TEST_F(AssetWriterTest, PlaysWhereverACrashCutsIt) {
  constexpr size_t kPicturesInFragment = 60 * mp4::MovieRecorder::kFragmentLength.count() / 1000;
  RecordingUnderTest recording(service_, path_);
  for (uint32_t i = 0; i < 300; ++i) {
    recording.appendPicture(picture(i, i / 60.0, i / 60.0));
    recording.appendSound(1, beepingSound(i / 60.0, 735));
  }
  recording.drop();  // as a crash leaves it, to its last fragment
  const auto whole = decodePictures(path_);
  ASSERT_GE(whole.size(), 240u);
  const auto size = std::filesystem::file_size(path_);
  std::mt19937 random(3);
  for (int round = 0; round < 5; ++round) {
    const std::string copy = scratch_ / "copy.mp4";
    std::filesystem::copy_file(path_, copy, std::filesystem::copy_options::overwrite_existing);
    const auto cut = size / 3 + random() % (size * 2 / 3);
    std::filesystem::resize_file(copy, cut);
    const auto played = decodePictures(copy);
    ASSERT_EQ(mp4::salvageMovie(copy), std::nullopt);
    EXPECT_EQ(probe(copy).errors, "") << "cut at " << cut;
    const auto kept = decodePictures(copy);
    EXPECT_EQ(kept.size() % kPicturesInFragment, 0u);
    EXPECT_LE(played.size(), kept.size() + 60);
    for (uint32_t i = 0; i < kept.size(); ++i) EXPECT_EQ(kept[i].number, i);
    EXPECT_EQ(mp4::salvageMovie(copy), std::nullopt);  // a second time changes nothing
    EXPECT_EQ(decodePictures(copy).size(), kept.size());
  }
  std::filesystem::resize_file(path_, 1500);
  EXPECT_TRUE(mp4::salvageMovie(path_).has_value());
  EXPECT_EQ(std::filesystem::file_size(path_), 1500u);
}

/// A disk that is full from some byte on.
class FullDisk final : public mp4::MovieFile {
 public:
  FullDisk(std::unique_ptr<mp4::MovieFile> file, uint64_t room, int failure)
      : file_(std::move(file)), room_(room), failure_(failure) {}
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) override {
    if (offset >= room_) return -failure_;
    return file_->writeAt(bytes.first(std::min<uint64_t>({bytes.size(), room_ - offset, 5000})), offset);
  }
  int truncate(uint64_t size) override { return file_->truncate(size); }
  int sync() override { return file_->sync(); }

 private:
  std::unique_ptr<mp4::MovieFile> file_;
  const uint64_t room_;
  const int failure_;
};

TEST_F(AssetWriterTest, KeepsWhatWasWrittenWhenTheDiskFails) {
  for (const int failure : {ENOSPC, EIO}) {
    const std::string path = scratch_ / std::to_string(failure);
    ffmpeg::FFmpegAssetWriterService service(
        [failure](const std::string& name) -> Result<std::unique_ptr<mp4::MovieFile>> {
          auto file = mp4::DiskMovieFile::create(name);
          return std::unique_ptr<mp4::MovieFile>(std::make_unique<FullDisk>(std::move(*file), 60'000, failure));
        });
    RecordingUnderTest recording(service, path);
    for (uint32_t i = 0; i < 1200 && recording.writer().status() == AssetWriterStatus::Writing; ++i) {
      recording.appendPicture(picture(i * 7919, i / 60.0, i / 60.0));
    }
    recording.finish();
    EXPECT_EQ(recording.writer().status(), AssetWriterStatus::Failed);
    ASSERT_TRUE(recording.writer().error().has_value());
    EXPECT_EQ(recording.writer().error()->code, failure);
    EXPECT_LE(std::filesystem::file_size(path), 60'000u);
    const auto movie = probe(path);
    EXPECT_EQ(movie.errors, "");
    EXPECT_GE(decodePictures(path).size(), 60u);
    EXPECT_GE(movie.duration, 1.0);
  }
}

TEST_F(AssetWriterTest, RefusesBadDestinationsAndSecondStarts) {
  std::ofstream(scratch_ / "there.mp4") << "x";
  for (const auto& url : {URL("http://example.com/a.mp4"), URL::fileURL(scratch_ / "there.mp4"),
                          URL::fileURL(scratch_ / "no/dir.mp4"), URL()}) {
    EXPECT_FALSE(service_.createAssetWriter(url, kFileTypeMPEG4).hasValue()) << url.absoluteString();
  }
  RecordingUnderTest recording(service_, path_);
  EXPECT_FALSE(recording.writer().startWriting());
  recording.finish();
  EXPECT_EQ(recording.writer().status(), AssetWriterStatus::Failed);  // there is nothing in it
}

/// In real time a picture that finds no room is dropped, never refused, and the sound stays whole.
TEST_F(AssetWriterTest, DropsPicturesButNoSoundWhenOverloaded) {
  auto writer = std::move(service_.createAssetWriter(URL::fileURL(path_), kFileTypeMPEG4).value());
  auto video = service_.createWriterInput(MediaType::Video, videoSettings(1280, 720));
  auto audio = service_.createWriterInput(MediaType::Audio, audioSettings());
  for (auto& input : {video, audio}) {
    input->setExpectsMediaDataInRealTime(true);
    writer->addInput(input);
  }
  EXPECT_FALSE(video->isReadyForMoreMediaData());
  ASSERT_TRUE(writer->startWriting());
  writer->startSessionAtSourceTime(at(0));
  EXPECT_TRUE(video->isReadyForMoreMediaData());
  const auto image = numberedPicture(5, 1280, 720);
  for (int i = 0; i < 300; ++i) {
    EXPECT_TRUE(video->append(SampleBuffer::makeVideo(image, at(i / 60.0), MediaTime::invalid())));
    EXPECT_TRUE(audio->append(beepingSound(i / 60.0, 735)));
  }
  std::promise<void> done;
  writer->finishWriting([&] { done.set_value(); });
  EXPECT_FALSE(video->isReadyForMoreMediaData());
  done.get_future().wait();
  EXPECT_EQ(writer->status(), AssetWriterStatus::Completed);
  EXPECT_EQ(probe(path_).errors, "");
  const auto pictures = decodePictures(path_);
  EXPECT_LT(pictures.size(), 300u);
  for (const auto& shown : pictures) EXPECT_NEAR(shown.time * 60, std::round(shown.time * 60), 0.01);
  const double shownFor = probe(path_).duration;
  EXPECT_EQ(beeps(decodeSound(path_, 0)).size(), static_cast<size_t>(std::ceil(shownFor - 0.05)));
}

}  // namespace
}  // namespace qv::platform::test
