#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <future>
#include <random>
#include <semaphore>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "platform/mp4/MovieFile.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

constexpr double kStart = 1000.25;

class AssetWriterTest : public ::testing::Test {
 protected:
  kit::ScratchFolder scratch_;
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

  const auto movie = probeGood(path_);
  ASSERT_EQ(movie.tracks.size(), 2u);
  EXPECT_EQ(movie.tracks[0].profile, "High");
  EXPECT_EQ(movie.tracks[0].rotation, -90);
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, 3.0, 1e-4) << track.type;
  expectPictures(path_, 0, 180, 60);
  expectBeeps(path_, 0, {0.75, 1.75, 2.75});
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
  const auto movie = probeGood(path_);
  ASSERT_EQ(movie.tracks.size(), 3u);
  const double length = 420 / kRate;
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, length, 1e-3);
  expectPictures(path_, 0, 420, kRate);
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

TEST_F(AssetWriterTest, TurnsPicturesThatLieAcrossTheTrackAndTurnsThemBackWhenShown) {
  RecordingUnderTest recording(service_, path_, 180, 320);
  recording.appendPictures(10, 10, 100, 0xA50);
  recording.finish();
  const auto movie = probeGood(path_);
  ASSERT_EQ(movie.tracks.size(), 1u);
  EXPECT_EQ(movie.tracks[0].width, 180);
  EXPECT_EQ(movie.tracks[0].height, 320);
  EXPECT_EQ(movie.tracks[0].rotation, -90);
  expectPictures(path_, 0xA50, 10, 10, Turning::AsShown);
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
    expectBeeps(path_, 0, {0, 1, 2});
    const auto sound = decodeSound(path_, 0);
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
  const auto movie = probeGood(path_);
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
  expectBeeps(path_, 0, {0, 69});
}

/// A disk that writes little at a time and fails from some byte on: for good, or only once, on the write or
/// on the sync after it.
struct DiskFault {
  int errnum;
  bool isOnce;
  bool isOnSync;
};
class FailingDisk final : public mp4::MovieFile {
 public:
  static constexpr uint64_t kRoom = 60'000;
  FailingDisk(std::unique_ptr<mp4::MovieFile> file, DiskFault fault) : file_(std::move(file)), fault_(fault) {}
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) override {
    end_ = std::max(end_, offset);
    if (!fault_.isOnSync && offset >= kRoom && fails()) return -fault_.errnum;
    const uint64_t room = offset < kRoom ? kRoom - offset : bytes.size();
    return file_->writeAt(bytes.first(std::min<uint64_t>({bytes.size(), room, 5000})), offset);
  }
  int truncate(uint64_t size) override { return file_->truncate(size); }
  int sync() override { return fault_.isOnSync && end_ >= kRoom && fails() ? fault_.errnum : file_->sync(); }
  int close() override { return file_->close(); }

 private:
  bool fails() { return !std::exchange(hasFailed_, true) || !fault_.isOnce; }

  std::unique_ptr<mp4::MovieFile> file_;
  const DiskFault fault_;
  uint64_t end_ = 0;
  bool hasFailed_ = false;
};

TEST_F(AssetWriterTest, KeepsWhatWasWrittenWhenTheDiskFails) {
  std::ofstream(scratch_ / "other.mp4") << "another movie";
  for (const DiskFault fault :
       {DiskFault{ENOSPC, false, false}, {EIO, false, false}, {EIO, true, false}, {EIO, false, true}}) {
    std::filesystem::remove(path_);
    ffmpeg::FFmpegAssetWriterService service(
        [fault](const std::string& name) -> Result<std::unique_ptr<mp4::MovieFile>> {
          auto file = mp4::DiskMovieFile::create(name);
          return std::unique_ptr<mp4::MovieFile>(std::make_unique<FailingDisk>(std::move(*file), fault));
        });
    RecordingUnderTest recording(service, path_);
    for (uint32_t i = 0; i < 1200 && recording.writer().status() == AssetWriterStatus::Writing; ++i) {
      recording.appendPicture(picture(i * 7919, i / 60.0, i / 60.0));
    }
    recording.finish();
    EXPECT_EQ(recording.writer().status(), AssetWriterStatus::Failed);
    ASSERT_TRUE(recording.writer().error().has_value());
    EXPECT_EQ(recording.writer().error()->code, fault.errnum);
    const auto movie = probeGood(path_);
    EXPECT_GE(decodePictures(path_).size(), 60u);
    EXPECT_GE(movie.duration, 1.0);
    // A disk that failed but once takes the index; what lacks it is finished at the daemon's next start.
    recording.drop();
    mp4::MP4MovieSalvage salvage;
    EXPECT_EQ(salvage.stateOfMovie(path_).value(), fault.isOnce ? MovieState::Finished : MovieState::Unfinished);
    EXPECT_TRUE(salvage.salvageMovie(path_));
    EXPECT_EQ(probe(path_).errors, "");
    EXPECT_NEAR(probe(path_).duration, movie.duration, 0.05);
  }
  EXPECT_EQ(std::filesystem::file_size(scratch_ / "other.mp4"), 13u);
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

/// A second of motion in a picture full of detail, then 70 s in which only the heartbeat comes, then motion again.
TEST_F(AssetWriterTest, HoldsAStillScreenToASmallRateWithKeyFramesByTime) {
  RecordingUnderTest recording(service_, path_, 1280, 720);
  double now = 0;
  for (uint32_t i = 0; i < 30; ++i, now += 1 / 30.0) recording.appendPicture(texturedPicture(i * 4, now));
  const double stillFrom = now;
  for (; now < stillFrom + 70; now += 0.5) recording.appendPicture(texturedPicture(30 * 4, now));
  const double stillTo = now;
  for (uint32_t i = 31; i < 61; ++i, now += 1 / 30.0) recording.appendPicture(texturedPicture(i * 4, now));
  recording.finish();
  const auto movie = probeGood(path_);
  EXPECT_NEAR(movie.duration, 72.0, 1e-3);
  double lastKey = 0;
  double bits = 0;
  double moving = 0;
  for (const auto& packet : packetsOfPictures(path_)) {
    if (packet.isKey) lastKey = packet.time;
    EXPECT_LE(packet.time - lastKey, 2.0);
    (packet.time >= stillFrom && packet.time < stillTo ? bits : moving) += static_cast<double>(packet.size) * 8;
  }
  EXPECT_LT(bits / 70, 200'000);
  EXPECT_GT(moving / 2, 500'000);  // the small rate ends with the stillness
}

/// In real time a picture that finds no room is dropped, never refused, evenly; the sound stays whole.
TEST_F(AssetWriterTest, DropsPicturesEvenlyButNoSoundWhenOverloaded) {
  fakes::LogRecorder log;
  // An encoder that takes one picture in the time in which three come.
  std::counting_semaphore<> turns(0);
  std::counting_semaphore<> taken(0);
  ffmpeg::H264Codec slow = ffmpeg::x264Codec();
  slow.setUp = [&](AVCodecContext& context, const std::string& node) -> Result<ffmpeg::FrameUpload> {
    (void)ffmpeg::x264Codec().setUp(context, node);
    return ffmpeg::FrameUpload([&](const AVFrame& planar) -> Result<ffmpeg::Frame> {
      taken.release();
      turns.acquire();
      return ffmpeg::Frame(av_frame_clone(&planar));
    });
  };
  ffmpeg::FFmpegAssetWriterService service(mp4::DiskMovieFile::create, {slow});
  auto writer = std::move(service.createAssetWriter(URL::fileURL(path_), kFileTypeMPEG4).value());
  auto video = service.createWriterInput(MediaType::Video, videoSettings(320, 180));
  auto audio = service.createWriterInput(MediaType::Audio, audioSettings());
  for (auto& input : {video, audio}) {
    input->setExpectsMediaDataInRealTime(true);
    writer->addInput(input);
  }
  EXPECT_FALSE(video->isReadyForMoreMediaData());
  ASSERT_TRUE(writer->startWriting());
  writer->startSessionAtSourceTime(at(0));
  constexpr uint32_t kPictures = 300;
  for (uint32_t i = 0; i < kPictures; ++i) {
    EXPECT_TRUE(video->isReadyForMoreMediaData());
    EXPECT_TRUE(video->append(picture(i, i / 60.0, i / 60.0)));
    EXPECT_TRUE(audio->append(beepingSound(i / 60.0, 735)));
    if (i == 0) taken.acquire();
    if (i % 3 != 2) continue;
    turns.release();
    taken.acquire();  // the next picture: the one before has left its place
  }
  turns.release(kPictures);
  std::promise<void> done;
  writer->finishWriting([&] { done.set_value(); });
  EXPECT_FALSE(video->isReadyForMoreMediaData());
  done.get_future().wait();
  EXPECT_EQ(writer->status(), AssetWriterStatus::Completed);
  EXPECT_EQ(probe(path_).errors, "");
  const auto pictures = decodePictures(path_);
  ASSERT_GT(pictures.size(), kPictures / 3);
  EXPECT_LT(pictures.size(), kPictures / 3 + 12);  // the queue, filled once
  for (const auto& shown : pictures) EXPECT_NEAR(shown.time * 60, shown.number, 0.01);
  for (size_t i = 1; i < pictures.size(); ++i) EXPECT_LE(pictures[i].number - pictures[i - 1].number, 3u) << i;
  flushLog();
  const auto dropped = std::to_string(kPictures - pictures.size());
  EXPECT_EQ(log.countContaining("movie finished: " + std::to_string(pictures.size()) + " pictures, " + dropped), 1u);
  EXPECT_EQ(beeps(decodeSound(path_, 0)).size(), 5u);
}

}  // namespace
}  // namespace qv::platform::test
