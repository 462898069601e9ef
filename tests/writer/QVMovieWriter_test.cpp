#include "writer/QVMovieWriter.h"

#include <cerrno>
#include <cmath>

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
    auto writer = std::make_shared<QVMovieWriter>(device_.platform, size, std::string(fakes::kStore) + "/Game.mp4");
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

TEST_F(MovieWriterTest, EncoderSettingsFollowSizeDeviceAndConfiguration) {
  struct Case {
    Size size;
    int64_t rate;
    double width, height;
  };
  for (const Case& c : {Case{{1280, 720}, 3000000, 1280, 720}, Case{{1920, 1080}, 5000000, 1920, 1080},
                        Case{{1080, 1920}, 5000000, 1080, 1920}, Case{{1919.9, 1080}, 3000000, 1920, 1080},
                        Case{{1001.5, 563.7}, 3000000, 1002, 564}, Case{{1, 1}, 3000000, 2, 2}}) {
    started(c.size);
    EXPECT_EQ(bitRate(), c.rate);
    const Dictionary& video = device_.movies.video().settings;
    EXPECT_EQ(valueForKey(video, settings::kVideoWidth).asDouble(), c.width);
    EXPECT_EQ(valueForKey(video, settings::kVideoHeight).asDouble(), c.height);
  }
  device_.deviceInfo.idiom = platform::UserInterfaceIdiom::Tablet;
  started();
  EXPECT_EQ(bitRate(), 7000000);
  started({1280, 720}, QVBroadcastConfiguration{5, {{settings::kAverageBitRate, Value(int64_t{900000})}}});
  EXPECT_EQ(bitRate(), 900000);
  platform::Data stereo(32, 0);
  stereo[0] = 2;
  stereo[2] = 101;
  const Dictionary sound{{settings::kFormatID, Value(platform::kAudioFormatMPEG4AAC)},
                         {settings::kNumberOfChannels, Value(int32_t{2})},
                         {settings::kSampleRate, Value(44100.0)},
                         {settings::kChannelLayout, Value(stereo)},
                         {settings::kEncoderBitRate, Value(int32_t{128000})}};
  EXPECT_EQ(device_.movies.appAudio().settings, sound);
  EXPECT_EQ(device_.movies.microphone().settings, sound);
  for (const auto& input : device_.movies.last().inputs) EXPECT_TRUE(input->realTime);
}

TEST_F(MovieWriterTest, TakesOnlyABitRateAsOverride) {
  for (const std::string value :
       {"12000000", "12000000.0", "true", "1e30", "1.5", "-5", "0.0", "\"12\"", "1e19", "200000001"}) {
    device_.preferences.set(R"({"QVBitRateOverride": )" + value + "}");
    started();
    EXPECT_EQ(bitRate(), value.starts_with("12") ? 12000000 : 3000000) << value;
  }
}

TEST_F(MovieWriterTest, HandsOnOnlyUsableCompressionProperties) {
  const auto with = [&](const Dictionary& custom) {
    started({1280, 720}, QVBroadcastConfiguration{5, custom});
    return compression();
  };
  started();
  const Dictionary defaults = compression();
  EXPECT_EQ(defaults, (Dictionary{{settings::kExpectedSourceFrameRate, Value(int32_t{60})},
                                  {settings::kProfileLevel, Value(settings::kProfileHighAutoLevel)},
                                  {settings::kAverageBitRate, Value(int64_t{3000000})},
                                  {settings::kMaxKeyFrameInterval, Value(int32_t{60})}}));
  const Dictionary unusable{{settings::kAverageBitRate, Value(int64_t{-1})},
                            {settings::kExpectedSourceFrameRate, Value(int32_t{0})},
                            {settings::kMaxKeyFrameInterval, Value(1e12)},
                            {settings::kProfileLevel, Value(int32_t{100})}};
  EXPECT_EQ(with(unusable), defaults);
  Dictionary usable{{settings::kMaxKeyFrameInterval, Value(30.0)},
                    {settings::kAverageBitRate, Value(int64_t{1})},
                    {settings::kExpectedSourceFrameRate, Value(int64_t{240})},
                    {settings::kProfileLevel, Value(settings::kProfileMainAutoLevel)},
                    {"Quality", Value(0.5)}};  // for the encoder to know
  const Dictionary handedOn = with(usable);
  usable[settings::kMaxKeyFrameInterval] = Value(int64_t{30});
  EXPECT_EQ(handedOn, usable);
}

TEST_F(MovieWriterTest, TimelineStartsAtTheFirstFrameAndTimesRise) {
  const auto writer = started();
  writer->appendAudio1SampleBuffer(audioAt(5));
  EXPECT_TRUE(writer->appendVideoSampleBuffer(nullptr, {}));
  const auto timeless = platform::SampleBuffer::makeVideo(fakes::makeFrame(0)->image(), {}, {});
  EXPECT_TRUE(writer->appendVideoSampleBuffer(timeless, {0, 1, -1, 0, 0, 0}));
  EXPECT_EQ(device_.movies.video().transform, (AffineTransform{0, 1, -1, 0, 0, 0}));
  EXPECT_TRUE(device_.movies.last().sessionStarts.empty());
  EXPECT_TRUE(append(*writer, 100));
  EXPECT_TRUE(append(*writer, 90));  // the first frame sets no last time
  EXPECT_TRUE(append(*writer, 200));
  EXPECT_TRUE(append(*writer, 200));
  EXPECT_TRUE(append(*writer, 150));
  EXPECT_TRUE(append(*writer, 300));
  writer->appendAudio1SampleBuffer(audioAt(110));
  writer->appendAudio1SampleBuffer(audioAt(110));
  writer->appendAudio2SampleBuffer(audioAt(105));
  writer->appendAudio2SampleBuffer(audioAt(104));
  writer->appendAudio2SampleBuffer(nullptr);
  EXPECT_EQ(device_.movies.video().times(), (std::vector<int64_t>{100, 90, 200, 300}));
  EXPECT_EQ(device_.movies.appAudio().times(), std::vector<int64_t>{110});
  EXPECT_EQ(device_.movies.microphone().times(), std::vector<int64_t>{105});
  EXPECT_EQ(finish(writer), std::string(fakes::kStore) + "/Game.mp4");
  EXPECT_TRUE(append(*writer, 400));
  writer->appendAudio1SampleBuffer(audioAt(400));
  EXPECT_EQ(device_.movies.video().samples.size(), 4u);
  EXPECT_EQ(device_.movies.appAudio().samples.size(), 1u);
}

TEST_F(MovieWriterTest, AFinishLetsGoOfWhatNoInputTook) {
  const auto writer = started();
  append(*writer, 100);
  for (const auto& input : device_.movies.last().inputs) input->ready = false;
  const auto picture = fakes::makeFrame(200);
  const platform::SampleBufferRef sounds[] = {platform::SampleBuffer::silencedCopy(audioAt(200)),
                                              platform::SampleBuffer::silencedCopy(audioAt(200))};
  writer->appendVideoSampleBuffer(picture, {});
  writer->appendAudio1SampleBuffer(sounds[0]);
  writer->appendAudio2SampleBuffer(sounds[1]);
  finish(writer);
  for (const auto& sample : {picture, sounds[0], sounds[1]})
    EXPECT_EQ(sample.use_count(), 2);  // the list's and its own
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
  EXPECT_EQ(device_.movies.last().sessionStarts,
            std::vector<MediaTime>{MediaTime::make(100, platform::kHostTimescale)});
  EXPECT_EQ(device_.movies.video().times(), std::vector<int64_t>{200});
  device_.movies.last().status = AssetWriterStatus::Failed;
  EXPECT_FALSE(append(*writer, 300));
  EXPECT_EQ(device_.movies.last().starts, 1);
}

TEST_F(MovieWriterTest, FailuresAnswerWithoutAMovie) {
  device_.movies.startFails = true;
  auto writer = started();
  device_.movies.last().error = platform::Error::posix(EIO);
  EXPECT_FALSE(append(*writer, 100));
  device_.movies.last().error = platform::Error::posix(ENOSPC);
  EXPECT_FALSE(append(*writer, 200));
  EXPECT_EQ(writer->failure(), platform::Error::posix(EIO)) << "the first that went wrong";
  EXPECT_EQ(device_.movies.last().starts, 1);
  EXPECT_EQ(finish(writer), "no movie");

  device_.movies.createFails = true;
  writer = started();
  ASSERT_TRUE(writer->failure());
  EXPECT_EQ(writer->failure()->code, EACCES);
  EXPECT_TRUE(append(*writer, 100));
  EXPECT_EQ(finish(writer), "no movie");
  EXPECT_FALSE(writer->isSound());
  EXPECT_EQ(finish(writer), "not called");  // a second finish is ignored
  EXPECT_EQ(startsAnswered_, 2);
}

TEST_F(MovieWriterTest, TheMovieEndsAtItsStopUnlessAnAnnouncedOneCameBefore) {
  const MediaTime stop = MediaTime::make(430, platform::kHostTimescale);
  const MediaTime lastFrame = MediaTime::make(200, platform::kHostTimescale);
  const auto endAfter = [&](bool isAnnounced, bool resumes, bool stops) {
    const auto writer = started();
    append(*writer, 100);
    append(*writer, 200);
    if (isAnnounced) writer->notifyRecordingMayBeStopped();
    if (resumes) writer->notifyRecordingResumed();
    append(*writer, 300);
    if (stops) writer->endAtSourceTime(stop);
    finish(writer);
    return device_.movies.last().sessionEnd;
  };
  EXPECT_EQ(endAfter(true, false, false), lastFrame);
  EXPECT_EQ(endAfter(true, false, true), lastFrame);
  EXPECT_FALSE(endAfter(true, true, false).isValid());
  EXPECT_EQ(endAfter(false, false, true), stop);
}

TEST_F(MovieWriterTest, TellsWhetherTheMovieIsSoundAndWhatFailed) {
  auto writer = started();
  append(*writer, 100);
  EXPECT_FALSE(writer->isSound());
  finish(writer);
  EXPECT_TRUE(writer->isSound());
  EXPECT_EQ(writer->failure(), std::nullopt);

  writer = started();
  append(*writer, 100);
  device_.movies.last().status = AssetWriterStatus::Failed;
  device_.movies.last().error = platform::Error::posix(EIO);
  EXPECT_EQ(finish(writer), std::string(fakes::kStore) + "/Game.mp4");
  EXPECT_FALSE(writer->isSound());
  EXPECT_EQ(writer->failure(), platform::Error::posix(EIO));

  writer = started();
  append(*writer, 100);
  device_.movies.last().error = platform::Error::posix(ENOSPC);
  device_.movies.last().finishFails = true;
  finish(writer);
  EXPECT_FALSE(writer->isSound());
  EXPECT_EQ(writer->failure(), platform::Error::posix(ENOSPC));
}

/// Each trim stands for itself: another one runs, and nobody holds the writer any more.
TEST_F(MovieWriterTest, TrimsAtOnceWithoutTheirWriter) {
  auto writer = started();
  const std::weak_ptr<QVMovieWriter> living = writer;
  device_.disk.addFile("/m.mp4", "movie");
  device_.exports.holds = true;
  std::vector<std::string> trimmed;
  for (const char* path : {"/a.mp4", "/b.mp4"}) {
    writer->trimMovieWithURL(URL::fileURL("/m.mp4"), 1, 1, URL::fileURL(path),
                             [&](const auto& url) { trimmed.push_back(url->path()); });
  }
  EXPECT_TRUE(device_.exports.sessions.empty());  // no movie is opened on the caller's thread
  writer.reset();
  device_.run();
  EXPECT_TRUE(living.expired());
  ASSERT_EQ(device_.exports.sessions.size(), 2u);
  device_.exports.sessions[1]->end();
  device_.exports.sessions[0]->end();
  EXPECT_EQ(trimmed, (std::vector<std::string>{"/b.mp4", "/a.mp4"}));
}

TEST_F(MovieWriterTest, TrimCutsWholeSecondsAndReportsFailure) {
  const auto writer = started();
  const URL movie = URL::fileURL("/m.mp4");
  std::optional<URL> trimmed;
  const auto trim = [&](double start, double end) {
    writer->trimMovieWithURL(movie, start, end, URL::fileURL("/t.mp4"), [&](const auto& url) { trimmed = url; });
    device_.run();
  };
  device_.disk.addFile("/m.mp4", "m");
  trim(2.4, 2.6);
  EXPECT_EQ(device_.exports.sessions.back()->fileType, platform::kFileTypeMPEG4);
  EXPECT_EQ(device_.exports.sessions.back()->preset, platform::ExportPreset::PassThrough);
  EXPECT_EQ(trimmed, URL::fileURL("/t.mp4"));
  EXPECT_EQ(device_.exports.sessions.back()->range.start, MediaTime::make(2, 1));
  EXPECT_EQ(device_.exports.sessions.back()->range.duration, MediaTime::make(90, 1));
  // A success is believed where there is a movie.
  device_.disk.addFile("/m.mp4", "");
  trim(1, 1);
  EXPECT_EQ(trimmed, std::nullopt);
  EXPECT_FALSE(device_.disk.itemExists("/t.mp4"));
  trimmed = movie;
  (void)device_.disk.removeItem("/m.mp4");
  trim(1, 1);
  EXPECT_EQ(trimmed, std::nullopt);
  device_.disk.addFile("/m.mp4", "movie");
  for (const auto end : {platform::ExportStatus::Failed, platform::ExportStatus::Cancelled}) {
    trimmed = movie;
    device_.exports.result = end;
    trim(1, 1);
    EXPECT_EQ(trimmed, std::nullopt);
  }
}

/// Whatever an export says that did not succeed: no mix, and no file of it.
TEST_F(MovieWriterTest, MixesOrTellsWhyNot) {
  using platform::ExportStatus;
  const QVAudioMixUtility mixes(device_.platform, QVTemporaryMovies::create(QVTemporaryFiles(device_.platform)));
  device_.disk.addFile("/m.mp4", "movie");
  device_.exports.holds = true;
  for (const auto end : {ExportStatus::Completed, ExportStatus::Failed, ExportStatus::Cancelled}) {
    std::shared_ptr<MovieClaim> mixed;
    std::optional<platform::Error> failure;
    mixes.mixAudioForMovie(URL::fileURL("/m.mp4"), [&](const auto& claim, const auto& error) {
      mixed = claim;
      failure = error;
    });
    device_.run();
    auto& session = *device_.exports.sessions.back();
    EXPECT_EQ(session.fileType, platform::kFileTypeMPEG4);
    EXPECT_EQ(session.preset, platform::ExportPreset::HighestQuality);
    session.result = end;
    session.end();
    device_.run();
    const bool isMixed = end == ExportStatus::Completed;
    EXPECT_EQ(mixed != nullptr, isMixed);
    EXPECT_EQ(failure, isMixed ? std::nullopt : std::optional(recordingError(errorcode::kFailedToSave)));
    EXPECT_EQ(device_.disk.itemExists(session.output.path()), isMixed);
  }
  std::optional<platform::Error> failure;
  mixes.mixAudioForMovie(std::nullopt, [&](const auto&, const auto& error) { failure = error; });
  EXPECT_EQ(failure, recordingError(errorcode::kMixingFailure));
}

}  // namespace
}  // namespace qv
