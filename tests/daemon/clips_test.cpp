#include "session/ClipHandover.h"
#include "session/ClipSeam.h"
#include "tests/daemon/BroadcastFixture.h"

namespace qv {
namespace {

using platform::ExtensionItem;
using platform::MediaTime;
using platform::SampleBuffer;
using platform::SampleBufferRef;
using platform::Value;

/// At a thousand frames a second, from one second on.
SampleBufferRef soundOf(int64_t frames, uint32_t bytesPerFrame, uint32_t framesPerPacket, size_t bytes) {
  const platform::AudioStreamDescription format{
      1000, platform::kAudioFormatLinearPCM, 0, bytesPerFrame, framesPerPacket, bytesPerFrame, 1, 8, 0};
  return SampleBuffer::makeAudio(
      std::make_shared<platform::DataBlock>(std::vector<uint8_t>(bytes)),
      std::make_shared<platform::AudioFormatDescription>(platform::AudioFormatDescription{format}), frames,
      MediaTime::make(kSecond, platform::kHostTimescale));
}

TEST(SplitSoundTest, CutsAtTheNearestFrameWhatHasFrames) {
  const SampleBufferRef bytes = soundOf(10, 1, 1, 10), words = soundOf(10, 2, 1, 20), packets = soundOf(10, 1, 2, 10);
  struct {
    SampleBufferRef sample;
    double at;  // ms after its start
    int64_t before, after;
  } const cases[] = {{bytes, -1, 0, 10},
                     {bytes, 0.4, 0, 10},
                     {bytes, 1, 1, 9},
                     {bytes, 9.6, 10, 0},
                     {bytes, 11, 10, 0},
                     {words, 9, 9, 1},
                     {packets, 0, 0, 10},
                     {packets, 4, 10, 0},
                     {soundOf(10, 1, 1, 9), 4, 10, 0},
                     {words, 4.4, 4, 6},
                     {soundOf(10, 0, 1, 10), 4, 10, 0}};
  for (const auto& [sample, at, before, after] : cases) {
    const auto time = MediaTime::make(kSecond + static_cast<int64_t>(at * 1e6), platform::kHostTimescale);
    const SplitSound split = splitSound(sample, time);
    EXPECT_EQ(split.before ? split.before->numSamples() : 0, before) << at;
    EXPECT_EQ(split.after ? split.after->numSamples() : 0, after) << at;
  }
}

class ClipHandoverTest : public testing::Test {
 protected:
  ~ClipHandoverTest() override {
    device_.timers.advance(ClipHandover::kLastClipsPatience);
    device_.run();
  }
  std::string complete(int64_t number, bool finished = false) {
    const auto clip = movies_->claimNew(std::string(fakes::kStore) + "/" + std::to_string(number) + ".mp4");
    device_.disk.addFile(clip->path(), "x");
    handover_->clipCompleted(number, clip, finished, [this, number] { handed_.push_back(number); });
    device_.run();
    return clip->path();
  }
  auto& requests() { return device_.extensions.requests; }

  fakes::FakeDevice device_;
  const std::shared_ptr<QVTemporaryMovies> movies_ = QVTemporaryMovies::create(device_.files);
  std::vector<int64_t> handed_;
  int failures_ = 0;
  std::shared_ptr<ClipHandover> handover_ = std::make_shared<ClipHandover>(
      device_.platform, device_.extensions.install("com.example.upload", broadcastpoint::kUpload),
      platform::Dictionary{}, ClipHandoverEvents{nullptr, nullptr, [this] { ++failures_; }});
};

TEST_F(ClipHandoverTest, HandsClipsOverInTheirOrderAndLetsGoWithTheLast) {
  complete(2);
  complete(3, true);
  EXPECT_TRUE(requests().empty());
  complete(1);
  EXPECT_EQ(handed_, (std::vector<int64_t>{1, 2, 3}));
  for (const size_t request : {0, 2, 1}) {
    EXPECT_TRUE(device_.extensions.killed.empty()) << request;
    device_.extensions.complete(request, std::vector<ExtensionItem>{});
    device_.run();
  }
  EXPECT_EQ(device_.extensions.killed.size(), 1u);
  EXPECT_EQ(failures_, 0);
}

TEST_F(ClipHandoverTest, AnExtensionThatLagsMissesClipsButTheLastAndIsEndedAtLast) {
  std::string path;
  for (int64_t number = 1; number <= 33; ++number) path = complete(number);
  EXPECT_EQ(requests().size(), ClipHandover::kMaximumOutstanding);
  EXPECT_FALSE(device_.disk.itemExists(path));
  complete(34, true);
  EXPECT_EQ(requests().size(), 33u);
  EXPECT_TRUE(device_.extensions.killed.empty());
  device_.timers.advance(ClipHandover::kLastClipsPatience);
  device_.run();
  EXPECT_EQ(device_.extensions.killed.size(), 1u);
  EXPECT_TRUE(device_.log.contains("the broadcast extension did not finish its last clips in time"));
}

TEST_F(ClipHandoverTest, AClipThatCannotBeHandedOverKeepsNobodyWaiting) {
  device_.extensions.refusesTokens = true;
  complete(1);
  EXPECT_TRUE(requests().empty());
  device_.extensions.refusesTokens = false;
  device_.extensions.launchError = platform::Error{"launch", 7, {}};
  const std::string path = complete(2, true);
  EXPECT_EQ(device_.extensions.revoked, std::vector<std::string>{"com.tarnwick.quorveld.read-only for " + path});
  EXPECT_FALSE(device_.disk.itemExists(path));
  EXPECT_EQ(failures_, 1);
  EXPECT_EQ(device_.extensions.killed.size(), 1u);
  EXPECT_EQ(handed_, (std::vector<int64_t>{1, 2}));
}

class ClipsTest : public BroadcastFixture {
 protected:
  ClipsTest() { suppressAlert(); }
  ~ClipsTest() override { client_.disconnect(); }
  void begin(const platform::Data& configuration = clipsOf(0.5)) {
    install(client_);
    setUp(client_, configuration);
    EXPECT_EQ(client_.start({.broadcast = true})->code(), 0);
  }
  std::vector<int64_t> microphoneFrames(size_t movie) {
    std::vector<int64_t> frames;
    for (const auto& sample : device_.movies.movies.at(movie)->inputs.at(2)->samples)
      frames.push_back(sample->numSamples());
    return frames;
  }
  size_t handed() { return device_.extensions.requests.size(); }
  TestClient client_ = game();
};

TEST_F(ClipsTest, AClipWaitsASecondForItsSound) {
  begin();
  play(100, 107);  // cut by the last sound, which lasts until 10.7 s
  for (int64_t tenth = 108; tenth <= 118; ++tenth) frame(tenth);
  EXPECT_EQ(device_.movies.movies.size(), 2u);
  EXPECT_EQ(handed(), 0u);
  frame(119);
  EXPECT_EQ(handed(), 1u);
}

TEST_F(ClipsTest, TheMicrophoneIsCutAtTheSeamAndAwaitedWhileItIsOn) {
  device_.deviceInfo.audioCaptureDevice = true;
  begin();
  frame(100);
  speak(100);
  for (int64_t tenth = 100; tenth <= 106; ++tenth) sound(tenth);
  speak(105);
  frame(107);
  EXPECT_EQ(handed(), 0u);
  speak(106.5);
  sound(107);
  EXPECT_EQ(handed(), 1u);
  EXPECT_EQ(microphoneFrames(0), (std::vector<int64_t>{4410, 4410, 2205}));
  EXPECT_EQ(microphoneFrames(1), (std::vector<int64_t>{2205}));
  speak(107.5);
  EXPECT_EQ(microphoneFrames(1), (std::vector<int64_t>{2205, 4410}));
  client_.request("pauseRecording");
  recordingOf(client_)->resumeSessionWithContextID(5);
  device_.run();
  frame(200);
  sound(200);
  frame(201);
  EXPECT_EQ(handed(), 2u) << "it has not been heard again";
}

TEST_F(ClipsTest, AStopInASeamLeavesAPictureToTheLastClip) {
  begin();
  play(100, 107);
  EXPECT_TRUE(device_.movies.video().samples.empty());
  client_.stop();
  EXPECT_EQ(device_.movies.video().samples.size(), 1u);
  ASSERT_EQ(handed(), 2u);
  EXPECT_EQ(device_.extensions.requests[1].value(broadcastitem::kRequestedFinish).asString(), "1");
  EXPECT_EQ(device_.movies.last().sessionEnd, device_.clock.hostTime());
}

}  // namespace
}  // namespace qv
