#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <future>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/VideoEncoderChoice.h"
#include "platform/mp4/MovieWriter.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

using ffmpeg::FrameUpload;
using ffmpeg::H264Codec;

/// libx264 as a device's encoder. Each of its encoders takes `pictures` and then fails.
H264Codec hardware(const std::string& name, int pictures = INT32_MAX) {
  H264Codec codec = ffmpeg::x264Codec();
  codec.setUp = [name, pictures](AVCodecContext& context, const std::string& node) -> Result<FrameUpload> {
    (void)ffmpeg::x264Codec().setUp(context, node);
    return FrameUpload([name, left = pictures](const AVFrame& planar) mutable -> Result<ffmpeg::Frame> {
      if (left-- == 0) return mp4::movieError(mp4::kMovieEncoderFailed, name + " stumbles");
      return ffmpeg::Frame(av_frame_clone(&planar));
    });
  };
  return codec;
}

/// As some devices do: nothing before the first packet.
H264Codec withParameterSetsInBand() {
  H264Codec codec = hardware("in band");
  codec.setUp = [inner = codec.setUp](AVCodecContext& context, const std::string& node) {
    auto upload = inner(context, node);
    context.flags &= ~AV_CODEC_FLAG_GLOBAL_HEADER;
    return upload;
  };
  return codec;
}

H264Codec refusingSizesOver(int width) {
  H264Codec codec = hardware("small");
  codec.setUp = [inner = codec.setUp, width](AVCodecContext& context, const std::string& node) -> Result<FrameUpload> {
    if (context.width > width) return mp4::movieError(mp4::kMovieEncoderFailed, "too large");
    return inner(context, node);
  };
  return codec;
}

class VideoEncoderChoiceTest : public ::testing::Test {
 protected:
  /// Records `count` pictures by the chosen encoder. The recording is over where it has failed.
  AssetWriterStatus record(std::vector<H264Codec> codecs, uint32_t count, uint32_t width = 320, uint32_t height = 180) {
    path_ = scratch_ / std::to_string(++recordings_) + ".mp4";
    ffmpeg::FFmpegAssetWriterService service(mp4::DiskMovieFile::create, std::move(codecs), patience_);
    service.prepareForWriting();
    RecordingUnderTest recording(service, path_, width, height);
    for (uint32_t i = 0; i < count && recording.writer().status() == AssetWriterStatus::Writing; ++i) {
      recording.appendPicture(picture(i, i / 30.0, i / 30.0, width, height));
      recording.appendSound(1, beepingSound(i / 30.0, 1470));
    }
    recording.finish();
    flushLog();
    return recording.writer().status();
  }

  fakes::LogRecorder log_;
  kit::ScratchFolder scratch_;
  std::string path_;
  int recordings_ = 0;
  std::chrono::milliseconds patience_ = std::chrono::minutes(10);  // no machine is too slow for a trial
};

TEST_F(VideoEncoderChoiceTest, TakesTheFirstThatEncodesAndTellsWhyOthersFell) {
  H264Codec noDevice = ffmpeg::vaapiCodec();
  noDevice.nodes = "/dev/nul[l]";
  H264Codec noOpen = hardware("");
  noOpen.setUp = [](AVCodecContext&, const std::string&) { return Result<FrameUpload>(FrameUpload()); };  // no format
  H264Codec noParameterSets{.name = "mpeg4", .setUp = [](AVCodecContext& context, const std::string&) {
                              context.pix_fmt = AV_PIX_FMT_YUV420P;
                              context.time_base = {1, 60};
                              return Result<FrameUpload>(FrameUpload());
                            }};
  H264Codec missing = hardware("");
  missing.name = "h264_none";
  H264Codec absent = hardware("");
  absent.nodes = "/dev/no-such-encoder*";
  EXPECT_EQ(record({missing, absent, noDevice, noOpen, hardware("early", 0), noParameterSets, withParameterSetsInBand(),
                    hardware("never tried", 0)},
                   60),
            AssetWriterStatus::Completed);
  EXPECT_EQ(probe(path_).errors, "");
  EXPECT_EQ(decodePictures(path_).size(), 60u);
  ASSERT_EQ(log_.countContaining("H.264 encoder: libx264, chosen in"), 1u);
  for (const char* reason : {"h264_none: Encoder not found", "libx264: no /dev/no-such-encoder*",
                             "h264_vaapi (/dev/null): device: ", "libx264: open: ", "libx264: early stumbles",
                             "mpeg4: no parameter sets came out"}) {
    EXPECT_EQ(log_.countContaining(reason), 1u) << reason;
  }
}

TEST_F(VideoEncoderChoiceTest, GoesOnToTheNextWhereASizeIsRefused) {
  EXPECT_EQ(record({refusingSizesOver(1280), hardware("large")}, 30, 1600, 180), AssetWriterStatus::Completed);
  EXPECT_EQ(decodePictures(path_).size(), 30u);
  EXPECT_EQ(1u, log_.countContaining("libx264 refuses 1600x180"));
}

/// What was encoded before is a whole movie by the time the failure is seen.
TEST_F(VideoEncoderChoiceTest, KeepsTheMovieOfAnEncoderThatFailsLater) {
  EXPECT_EQ(record({hardware("tired", 45), ffmpeg::x264Codec()}, 90), AssetWriterStatus::Failed);
  const auto movie = probeGood(path_);
  EXPECT_EQ(decodePictures(path_).size(), 45u);
  ASSERT_EQ(movie.tracks.size(), 2u);
  EXPECT_EQ(beeps(decodeSound(path_, 0)).size(), 2u);
  EXPECT_GE(log_.countContaining("tired stumbles"), 1u);
}

/// A driver that hangs holds up no recording.
TEST_F(VideoEncoderChoiceTest, WaitsForNoTrialThatHangs) {
  std::promise<void> release;
  std::promise<void> left;
  H264Codec hanging = hardware("");
  hanging.setUp = [released = release.get_future().share(), &left](AVCodecContext&, const std::string&) {
    released.wait();
    left.set_value();
    return Result<FrameUpload>(mp4::movieError(mp4::kMovieEncoderFailed, "late"));
  };
  patience_ = std::chrono::milliseconds(0);
  EXPECT_EQ(record({hanging, ffmpeg::x264Codec()}, 10), AssetWriterStatus::Completed);
  EXPECT_EQ(decodePictures(path_).size(), 10u);
  EXPECT_EQ(1u, log_.countContaining("still being tried, taking libx264"));
  release.set_value();
  left.get_future().wait();
}

/// What hardware is given: the same picture, its chroma interleaved; memory comes back into use.
TEST_F(VideoEncoderChoiceTest, HandsHardwareTheSamePicture) {
  AVCodecContext context{};
  auto upload = ffmpeg::v4l2Codec().setUp(context, "");
  ASSERT_TRUE(upload.hasValue());
  ffmpeg::Frame planar(av_frame_alloc());
  planar->format = AV_PIX_FMT_YUV420P;
  planar->width = 64;
  planar->height = 32;
  ASSERT_EQ(av_frame_get_buffer(planar.get(), 0), 0);
  for (int plane = 0; plane < 3; ++plane) {
    const int rows = plane == 0 ? 32 : 16;
    for (int i = 0; i < planar->linesize[plane] * rows; ++i) {
      planar->data[plane][i] = static_cast<uint8_t>(i * 7 + plane * 50);
    }
  }
  auto held = std::move(upload.value()(*planar).value());
  auto other = std::move(upload.value()(*planar).value());
  EXPECT_NE(held->data[0], other->data[0]);
  const uint8_t* const freed = other->data[0];
  other.reset();
  EXPECT_EQ(upload.value()(*planar).value()->data[0], freed);
  EXPECT_EQ(held->format, AV_PIX_FMT_NV12);
  for (int y = 0; y < 32; ++y) {
    for (int x = 0; x < 64; ++x) {
      ASSERT_EQ(held->data[0][y * held->linesize[0] + x], planar->data[0][y * planar->linesize[0] + x]);
      const uint8_t chroma = held->data[1][y / 2 * held->linesize[1] + x];
      const int plane = 1 + x % 2;
      ASSERT_EQ(chroma, planar->data[plane][y / 2 * planar->linesize[plane] + x / 2]);
    }
  }
}

}  // namespace
}  // namespace qv::platform::test
