#include "daemon/RequestErrors.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::UserAlertAnswer;
using platform::Value;

/// What a start is answered, and when.
using StartAnswersTest = QuietDaemonTest;
class StartQuestionsTest : public DaemonTest {};

TEST_F(StartAnswersTest, AStopWaitsForItsStartHoweverEarlyItComes) {
  auto client = game();
  for (int pieces = 0; pieces < kPieces; ++pieces) {
    const auto started = client.postStart({});
    runWork(pieces);
    const auto stopped = client.post("stopRecordingWithHandler");
    const auto again = client.post("stopRecordingWithHandler");
    device_.run();
    ASSERT_TRUE(*started && *stopped && *again) << pieces;
    EXPECT_EQ((*again)->failureName(), requesterror::kNotRecording) << pieces;
    EXPECT_EQ((*started)->code(), 0) << pieces;
    ASSERT_FALSE((*stopped)->failure) << pieces << ": " << (*stopped)->failureName();
    EXPECT_EQ((*stopped)->code(1), errorcode::kFailedToSave) << "no picture came";
    EXPECT_TRUE(client.takeEnds().empty());
    EXPECT_EQ(openTransactions(), 0);
    EXPECT_TRUE(areSourcesOff());
  }
}

TEST_F(StartAnswersTest, AStartWhoseEndHasAKnownCauseIsAnsweredThatCause) {
  device_.applications.frontmost = "com.example.chat";
  for (int pieces = 0; pieces < 2 * kPieces; ++pieces) {
    const bool isSystem = pieces >= kPieces;
    auto client = isSystem ? systemUI() : game();
    const auto started = client.postStart({.system = isSystem});
    runWork(pieces % kPieces);
    device_.purgeableSpace.callbacks.purge(1, 3);
    device_.run();
    ASSERT_TRUE(*started) << pieces;
    std::vector<int64_t> told = client.takeEnds();
    if ((*started)->code() != 0) told.push_back((*started)->code());
    if (client.isRecording()) {
      EXPECT_TRUE(told.empty()) << pieces;
      client.stop();
    } else {
      EXPECT_EQ(told, std::vector<int64_t>{errorcode::kInsufficientStorage}) << pieces;
    }
    EXPECT_EQ(openTransactions(), 0);
  }
}

TEST_F(StartAnswersTest, AStartBetweenAReportedMediaResetAndItsCompletionRecords) {
  auto client = game();
  record(client);
  auto& controller = device_.screen.last();
  controller.delegate.lock()->screenCaptureControllerMediaServicesWereReset(controller);
  EXPECT_EQ(client.start()->code(), 0);
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kMediaServicesFailed});
  sendFrame(2 * kSecond);
  const auto stopped = client.stop();
  ASSERT_FALSE(stopped->failure) << stopped->failureName();
  EXPECT_EQ(stopped->code(1), 0);
  EXPECT_EQ(contentAt(stopped->values[0].asString()), "movie 1");
}

TEST_F(StartQuestionsTest, TheUserIsAskedAboutNothingThatWillNotBeRecorded) {
  auto client = game();
  EXPECT_EQ(client.start({.microphone = true, .camera = true}), std::nullopt);
  EXPECT_TRUE(device_.alerts.shown.at(0)->request.alternateButton.empty()) << "there is no microphone";
  device_.alerts.answer(UserAlertAnswer::Default);
  device_.run();
  ASSERT_EQ(client.answer()->code(), 0);
  EXPECT_FALSE(client.answer()->values[1].asBool());
  EXPECT_FALSE(client.answer()->values[2].asBool());
  client.stop();

  device_.deviceInfo.audioCaptureDevice = true;
  EXPECT_EQ(client.start({.microphone = true, .camera = true}), std::nullopt);
  const auto& asked = device_.alerts.shown.at(1)->request;
  EXPECT_TRUE(asked.message.ends_with(" ACKNOWLEDGEMENT_ALERT_BODY_MIC")) << asked.message;
  device_.alerts.answer(UserAlertAnswer::Alternate);
  device_.run();
  ASSERT_EQ(client.answer()->code(), 0);
  EXPECT_TRUE(client.answer()->values[1].asBool());
  EXPECT_FALSE(client.answer()->values[2].asBool()) << "no camera is recorded";
}

TEST_F(StartAnswersTest, WindowsAreFewAndEachIsAskedForOnce) {
  auto client = game();
  std::vector<uint32_t> contexts;
  for (uint32_t context = 1; context <= 64; ++context) {
    contexts.insert(contexts.end(), 20, context);
    device_.applications.owners[context] = 100;
  }
  EXPECT_EQ(client.start({.contexts = contexts})->code(), 0);
  EXPECT_EQ(device_.applications.ownersAsked, 64);
  contexts.push_back(65);
  device_.applications.owners[65] = 100;
  EXPECT_EQ(client.start({.contexts = contexts})->code(), errorcode::kFailedToStart);
}

TEST_F(StartAnswersTest, NoMovieIsSmallerThanAPictureCanBe) {
  auto client = game();
  for (const auto& [width, height] : {std::pair(1.0, 1.0), std::pair(1.0, 1080.0), std::pair(4000.0, 1.0)}) {
    const int64_t code = client.start({.width = width, .height = height})->code();
    if (code != 0) {
      EXPECT_EQ(code, errorcode::kFailedToStart) << width << " x " << height;
      continue;
    }
    const auto& settings = device_.movies.video().settings;
    EXPECT_GE(settings.at(platform::settings::kVideoWidth).asDouble(), 2) << width << " x " << height;
    EXPECT_GE(settings.at(platform::settings::kVideoHeight).asDouble(), 2) << width << " x " << height;
    client.stop();
  }
  EXPECT_EQ(client.start({.width = 1e6, .height = 1e6})->code(), 0);
  client.stop();
  for (const auto& [width, height] : {std::pair(1e6 + 1, 720.0), std::pair(1280.0, 0.5)}) {
    EXPECT_EQ(client.start({.width = width, .height = height})->code(), errorcode::kFailedToStart);
  }
}

}  // namespace
}  // namespace qv
