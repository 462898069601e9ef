#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <future>
#include <semaphore>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

constexpr double kRecordingStart = 1000.25;

class AssetWriterTest : public ::testing::Test {
 protected:
  kit::ScratchFolder scratch_;
  ffmpeg::FFmpegAssetWriterService service_;
  const std::string path_ = scratch_ / "movie.mp4";
};

TEST_F(AssetWriterTest, WritesEveryPictureAtItsTimeAndLeavesOutASilentTrack) {
  RecordingUnderTest recording(service_, path_, 320, 180, {0, 1, -1, 0, 0, 0});
  for (uint32_t i = 0; i < 180; ++i) {
    const double now = kRecordingStart + i / 60.0;
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

/// A second of motion in a picture full of detail, then 70 s in which only the heartbeat comes, then motion again; a
/// beep in either.
TEST_F(AssetWriterTest, HoldsAStillScreenToASmallRateWithKeyFramesByTime) {
  RecordingUnderTest recording(service_, path_, 1280, 720);
  double now = 0;
  for (uint32_t i = 0; i < 30; ++i, now += 1 / 30.0) recording.appendPicture(texturedPicture(i * 4, now));
  recording.appendSound(1, beepingSound(0, 44100));
  const double stillFrom = now;
  for (; now < stillFrom + 70; now += 0.5) recording.appendPicture(texturedPicture(30 * 4, now));
  const double stillTo = now;
  recording.appendSound(1, beepingSound(70, 44100));
  for (uint32_t i = 31; i < 61; ++i, now += 1 / 30.0) recording.appendPicture(texturedPicture(i * 4, now));
  recording.finish();
  const auto movie = probeGood(path_);
  for (const auto& track : movie.tracks) EXPECT_NEAR(track.duration, 72.0, 1e-3);
  expectBeeps(path_, 0, {0, 70});
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
