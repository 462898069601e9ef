#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {
namespace {

class VideoSettingsTest : public ::testing::Test {
 protected:
  kit::ScratchFolder scratch_;
  ffmpeg::FFmpegAssetWriterService service_;
  const std::string path_ = scratch_ / "movie.mp4";
};

/// Windows of a pixel, and of sides that a capture truncates to odd ones: the picture fills the track, its last column
/// and row repeated.
TEST_F(VideoSettingsTest, FillsTracksOfEverySize) {
  struct Case {
    uint32_t width, height;  // of the capture
    int codedWidth, codedHeight;
  };
  for (const Case& c : {Case{1, 1, 2, 2}, {3, 1, 4, 2}, {1, 40, 2, 40}, {1001, 563, 1002, 564}}) {
    std::filesystem::remove(path_);
    RecordingUnderTest recording(service_, path_, static_cast<uint32_t>(c.codedWidth),
                                 static_cast<uint32_t>(c.codedHeight));
    for (uint32_t i = 0; i < 10; ++i)  // the window changes its size
      recording.appendPicture(picture(0xFFFF, i / 30.0, i / 30.0, i < 5 ? c.width : 90, c.height));
    recording.finish();
    EXPECT_EQ(recording.writer().status(), AssetWriterStatus::Completed);
    const auto movie = probeGood(path_);
    ASSERT_EQ(movie.tracks.size(), 1u);
    EXPECT_EQ(movie.tracks[0].width, c.codedWidth);
    EXPECT_EQ(movie.tracks[0].height, c.codedHeight);
    EXPECT_EQ(decodePictures(path_).size(), 10u);
    const std::string luma =
        run("ffmpeg -v error -nostdin -i '" + path_ + "' -frames:v 1 -f rawvideo -pix_fmt gray - 2>/dev/null");
    ASSERT_EQ(luma.size(), static_cast<size_t>(c.codedWidth * c.codedHeight));
    EXPECT_TRUE(std::all_of(luma.begin(), luma.end(), [](char y) { return static_cast<uint8_t>(y) > 200; }))
        << c.width << "x" << c.height;
  }
}

TEST_F(VideoSettingsTest, FollowsTheProfileAndTellsWhatItCannot) {
  struct Case {
    const char* name;
    const char* profile;
    const char* line;
  };
  for (const Case& c : {Case{settings::kProfileBaselineAutoLevel, "Constrained Baseline", nullptr},
                        {settings::kProfileMainAutoLevel, "Main", nullptr},
                        {settings::kProfileHighAutoLevel, "High", nullptr},
                        {"H264_Main_3_0", "Main", "the level of H264_Main_3_0 is not followed"},
                        {"HEVC_Main_AutoLevel", "High", "profile HEVC_Main_AutoLevel is unknown, High is taken"}}) {
    std::filesystem::remove(path_);
    fakes::LogRecorder log;
    Dictionary video = videoSettings(320, 180);
    Dictionary properties = valueForKey(video, settings::kCompressionProperties).asDictionary();
    properties.insert_or_assign(settings::kProfileLevel, Value(c.name));
    properties.insert_or_assign("Quality", Value(0.5));
    properties.insert_or_assign("Quantity", Value(true));
    video.insert_or_assign(settings::kCompressionProperties, Value(properties));
    RecordingUnderTest recording(service_, path_, video);
    recording.appendPictures(30, 30);
    recording.finish();
    const auto movie = probeGood(path_);
    EXPECT_EQ(movie.tracks.at(0).profile, c.profile) << c.name;
    EXPECT_EQ(decodePictures(path_).size(), 30u);
    flushLog();
    EXPECT_EQ(log.countContaining("2 compression properties are unknown and ignored: Quality, Quantity"), 1u);
    EXPECT_EQ(log.countContaining(c.name), c.line ? 1u : 0u);
    if (!c.line) continue;
    EXPECT_EQ(log.countContaining(c.line), 1u);
  }
}

}  // namespace
}  // namespace qv::platform::test
