#include "writer/QVMovieWriter.h"

#include "support/QuorvelErrors.h"
#include "tests/fakes/FakeDevice.h"
#include "writer/QVAudioMixUtility.h"

namespace qv {
namespace {

using platform::AffineTransform;
using platform::AssetWriterStatus;
using platform::Dictionary;
using platform::MediaTime;
using platform::Size;
using platform::URL;
using platform::Value;
namespace settings = platform::settings;

platform::SampleBufferRef audioAt(int64_t nanoseconds) {
  static const auto format = std::make_shared<const platform::AudioFormatDescription>(
      platform::AudioFormatDescription{{44100, platform::kAudioFormatLinearPCM, 14, 2, 1, 2, 1, 16, 0}});
  return platform::SampleBuffer::makeAudio(std::make_shared<platform::DataBlock>(std::vector<uint8_t>(200, 1)), format,
                                           100, MediaTime::make(nanoseconds, platform::kHostTimescale));
}

class MovieWriterTest : public testing::Test {
 protected:
  std::shared_ptr<QVMovieWriter> started(Size size = {1280, 720},
                                         std::optional<QVBroadcastConfiguration> configuration = std::nullopt) {
    auto writer = std::make_shared<QVMovieWriter>(size, std::string(fakes::kStore) + "/Game.mp4");
    writer->setBroadcastConfig(std::move(configuration));
    writer->startWritingHandler([this] { ++startsAnswered_; });
    device_.run();
    return writer;
  }
  static bool append(QVMovieWriter& writer, int64_t nanoseconds) {
    return writer.appendVideoSampleBuffer(fakes::makeFrame(nanoseconds), AffineTransform::identity());
  }
  /// What the handler got; "not called" where it was not.
  std::string finish(const std::shared_ptr<QVMovieWriter>& writer) {
    std::string answer = "not called";
    writer->finishWritingWithHandler([&](const auto& url) { answer = url ? url->path() : "no movie"; });
    device_.run();
    return answer;
  }
  Dictionary compression() {
    return valueForKey(device_.movies.video().settings, settings::kCompressionProperties).asDictionary();
  }
  int64_t bitRate() { return valueForKey(compression(), settings::kAverageBitRate).asInteger(); }

  fakes::FakeDevice device_;
  int startsAnswered_ = 0;
};

TEST_F(MovieWriterTest, EncoderSettingsFollowSizeDevicePreferenceAndConfiguration) {
  struct Case {
    Size size;
    int64_t rate;
    double width, height;
  };
  for (const Case& c : {Case{{1280, 720}, 3000000, 1280, 720}, Case{{1920, 1080}, 5000000, 1920, 1080},
                        Case{{1080, 1920}, 5000000, 1080, 1920}, Case{{1919.9, 1080}, 3000000, 1920, 1080},
                        Case{{1001.5, 563.7}, 3000000, 1002, 564}}) {
    started(c.size);
    EXPECT_EQ(bitRate(), c.rate);
    const Dictionary& video = device_.movies.video().settings;
    EXPECT_EQ(valueForKey(video, settings::kVideoWidth).asDouble(), c.width);
    EXPECT_EQ(valueForKey(video, settings::kVideoHeight).asDouble(), c.height);
  }
  device_.deviceInfo.idiom = platform::UserInterfaceIdiom::Tablet;
  started();
  EXPECT_EQ(bitRate(), 7000000);
  device_.preferences.set("com.tarnwick.quorveld", "QVBitRateOverride", Value(int64_t{12000000}));
  started();
  EXPECT_EQ(bitRate(), 12000000);
  EXPECT_TRUE(device_.log.contains("bit rate set to 12000000"));
  device_.preferences.set("com.tarnwick.quorveld", "QVBitRateOverride", Value("fast"));
  started({1280, 720}, QVBroadcastConfiguration{5, {{settings::kAverageBitRate, Value(int64_t{900000})}}});
  EXPECT_EQ(bitRate(), 900000);
  EXPECT_EQ(valueForKey(compression(), settings::kMaxKeyFrameInterval).asInteger(), 60);
  EXPECT_TRUE(device_.movies.appAudio().realTime);
}

TEST_F(MovieWriterTest, TimelineStartsAtTheFirstFrameAndTimesRise) {
  const auto writer = started();
  writer->appendAudio1SampleBuffer(audioAt(5));
  EXPECT_TRUE(append(*writer, 100));
  EXPECT_TRUE(append(*writer, 90));  // the first frame sets no last time
  EXPECT_TRUE(append(*writer, 200));
  EXPECT_TRUE(append(*writer, 200));
  EXPECT_TRUE(append(*writer, 150));
  EXPECT_TRUE(append(*writer, 300));
  writer->appendAudio1SampleBuffer(audioAt(110));
  writer->appendAudio1SampleBuffer(audioAt(110));
  writer->appendAudio2SampleBuffer(audioAt(105));
  EXPECT_EQ(device_.movies.video().times(), (std::vector<int64_t>{100, 90, 200, 300}));
  EXPECT_EQ(device_.movies.appAudio().times(), std::vector<int64_t>{110});
  EXPECT_EQ(device_.movies.microphone().times(), std::vector<int64_t>{105});
  EXPECT_EQ(device_.log.count("discarding video sample buffer due to timestamp earlier than previous"), 2u);
  EXPECT_EQ(device_.log.count("discarding audio 1 sample buffer due to timestamp earlier than previous"), 1u);
  EXPECT_EQ(finish(writer), std::string(fakes::kStore) + "/Game.mp4");
}

TEST_F(MovieWriterTest, WhatABusyInputCannotTakeWaitsInOrder) {
  const auto writer = started();
  append(*writer, 100);
  device_.movies.video().ready = false;
  append(*writer, 200);
  append(*writer, 300);
  EXPECT_EQ(device_.movies.video().times().size(), 1u);
  device_.movies.video().ready = true;
  append(*writer, 400);
  EXPECT_EQ(device_.movies.video().times(), (std::vector<int64_t>{100, 200, 300, 400}));
}

TEST_F(MovieWriterTest, ADroppedFirstSampleLeavesTheNextOneFirstAndNothingStartsTwice) {
  const auto writer = started();
  device_.movies.video().ready = false;
  EXPECT_TRUE(append(*writer, 100));
  device_.movies.video().ready = true;
  EXPECT_TRUE(append(*writer, 200));
  EXPECT_EQ(device_.movies.last().starts, 1);
  EXPECT_EQ(device_.movies.last().sessionStarts.size(), 1u);
  EXPECT_EQ(device_.movies.video().times(), std::vector<int64_t>{200});
  device_.movies.last().status = AssetWriterStatus::Failed;
  EXPECT_FALSE(append(*writer, 300));
  EXPECT_EQ(device_.movies.last().starts, 1);
}

TEST_F(MovieWriterTest, FailuresAnswerWithoutAMovie) {
  device_.movies.startFails = true;
  auto writer = started();
  EXPECT_FALSE(append(*writer, 100));
  EXPECT_TRUE(device_.log.contains("ERROR starting asset writer"));
  EXPECT_EQ(finish(writer), "no movie");

  device_.movies.createFails = true;
  writer = started();
  EXPECT_TRUE(append(*writer, 100));
  EXPECT_EQ(finish(writer), "no movie");
  EXPECT_EQ(finish(writer), "not called");  // a second finish is ignored
  EXPECT_EQ(startsAnswered_, 2);
}

TEST_F(MovieWriterTest, AnAnnouncedStopEndsTheMovieThereUnlessItResumes) {
  auto writer = started();
  append(*writer, 100);
  append(*writer, 200);
  writer->notifyRecordingMayBeStopped();
  append(*writer, 300);
  finish(writer);
  EXPECT_EQ(device_.movies.last().sessionEnd, MediaTime::make(200, platform::kHostTimescale));
  writer = started();
  append(*writer, 100);
  append(*writer, 200);
  writer->notifyRecordingMayBeStopped();
  writer->notifyRecordingResumed();
  finish(writer);
  EXPECT_FALSE(device_.movies.last().sessionEnd.isValid());
}

TEST_F(MovieWriterTest, TrimCutsWholeSecondsAndReportsFailure) {
  const auto writer = started();
  const URL movie = URL::fileURL("/m.mp4");
  std::optional<URL> trimmed;
  const auto trim = [&](double start, double end) {
    writer->trimMovieWithURL(movie, start, end, URL::fileURL("/t.mp4"), [&](const auto& url) { trimmed = url; });
    device_.run();
  };
  trim(2.4, 2.6);
  EXPECT_EQ(trimmed, URL::fileURL("/t.mp4"));
  EXPECT_EQ(device_.exports.sessions.back()->range.start, MediaTime::make(2, 1));
  EXPECT_EQ(device_.exports.sessions.back()->range.duration, MediaTime::make(90, 1));
  device_.exports.result = platform::ExportStatus::Failed;
  trim(1, 1);
  EXPECT_EQ(trimmed, std::nullopt);
}

TEST_F(MovieWriterTest, MixNamesEveryTrackAndMapsItsErrors) {
  std::optional<URL> mixed;
  std::optional<platform::Error> error;
  const auto mix = [&](const std::optional<URL>& movie) {
    QVAudioMixUtility::mixAudioForMovie(movie, [&](const auto& url, const auto& failure) {
      mixed = url;
      error = failure;
    });
  };
  device_.clock.setNow({1700000000.9});
  mix(URL::fileURL("/m.mp4"));
  EXPECT_TRUE(mixed->path().ends_with("/QVQuorvel_Final1700000000.mp4"));
  EXPECT_EQ(device_.exports.sessions.back()->mix.size(), 2u);
  mix(std::nullopt);
  EXPECT_EQ(error->code, errorcode::kMixingFailure);
  device_.exports.result = platform::ExportStatus::Cancelled;
  mix(URL::fileURL("/m.mp4"));
  EXPECT_EQ(error->code, errorcode::kFailedToSave);
}

}  // namespace
}  // namespace qv
