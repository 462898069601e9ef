#include <gtest/gtest.h>
#include <unistd.h>

#include <condition_variable>
#include <cstdlib>
#include <future>
#include <mutex>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/headless/TestSignal.h"

namespace qv::platform {
namespace {

UserAlertAnswer answerOf(HeadlessPlatform& platform, const UserAlertRequest& request) {
  std::promise<UserAlertAnswer> promise;
  const auto alert = platform.userAlerts().present(request, [&](UserAlertAnswer a) { promise.set_value(a); });
  return promise.get_future().get();
}

const UserAlertRequest kTwoButtons{"Title", "Text", "Record", "", "Refuse", ""};
const UserAlertRequest kThreeButtons{"Title", "Text", "Refuse", "With microphone", "Screen only", ""};

TEST(HeadlessAlerts, AnswerAsTheEnvironmentSays) {
  HeadlessPlatform platform({});
  const struct {
    const char* value;
    UserAlertAnswer two, three;
  } cases[] = {{"accept", UserAlertAnswer::Default, UserAlertAnswer::Alternate},
               {"decline", UserAlertAnswer::Other, UserAlertAnswer::Default},
               {"alternate", UserAlertAnswer::Cancelled, UserAlertAnswer::Alternate},
               {"other", UserAlertAnswer::Other, UserAlertAnswer::Other},
               {"cancel", UserAlertAnswer::Cancelled, UserAlertAnswer::Cancelled},
               {"yes please", UserAlertAnswer::Cancelled, UserAlertAnswer::Cancelled}};
  for (const auto& test : cases) {
    ::setenv("QUORVEL_HEADLESS_ALERT", test.value, 1);
    EXPECT_EQ(answerOf(platform, kTwoButtons), test.two) << test.value;
    EXPECT_EQ(answerOf(platform, kThreeButtons), test.three) << test.value;
  }
  ::unsetenv("QUORVEL_HEADLESS_ALERT");
  EXPECT_EQ(answerOf(platform, kTwoButtons), UserAlertAnswer::Cancelled) << "nobody is there to consent";
}

TEST(HeadlessAlerts, AnAlertTakenAwayDoesNotAnswer) {
  std::promise<void> asked, release, answered;
  HeadlessPlatform platform({.alertPolicy = [&](const UserAlertRequest& request) -> std::optional<UserAlertAnswer> {
    if (request.header == "first") {
      asked.set_value();
      release.get_future().wait();
    }
    return UserAlertAnswer::Default;
  }});
  bool called = false;
  auto alert = platform.userAlerts().present({"first", "", "OK", "", "", ""}, [&](UserAlertAnswer) { called = true; });
  asked.get_future().wait();
  alert.reset();
  release.set_value();
  const auto second =
      platform.userAlerts().present({"second", "", "OK", "", "", ""}, [&](UserAlertAnswer) { answered.set_value(); });
  answered.get_future().wait();
  EXPECT_FALSE(called);
}

TEST(HeadlessApplications, ReportsTheFront) {
  HeadlessPlatform platform({.processOfBundleIdentifier = [](const std::string&) { return std::optional<pid_t>(42); }});
  auto& applications = platform.applications();
  const auto monitor = applications.createStateMonitor();
  std::mutex mutex;
  std::condition_variable changed;
  std::vector<Dictionary> reports;
  monitor->setHandler([&](const Dictionary& report) {
    std::lock_guard lock(mutex);
    reports.push_back(report);
    changed.notify_all();
  });
  EXPECT_FALSE(applications.frontmostApplication());
  applications.setFrontmostApplication("com.example.a");
  applications.setFrontmostApplication("com.example.b");
  EXPECT_EQ(applications.frontmostApplication(), "com.example.b");
  std::unique_lock lock(mutex);
  changed.wait(lock, [&] { return reports.size() >= 3; });
  EXPECT_EQ(valueForKey(reports[2], applicationstate::kBundleIDKey).asString(), "com.example.b");
  EXPECT_TRUE(valueForKey(reports[2], applicationstate::kIsFrontmostKey).asBool());
  EXPECT_FALSE(valueForKey(reports[1], applicationstate::kIsFrontmostKey).asBool());
  EXPECT_EQ(valueForKey(reports[2], applicationstate::kProcessIDKey).asInteger(), 42);
  EXPECT_EQ(monitor->applicationStateForBundleIdentifier("com.example.c"), kApplicationForeground);
  EXPECT_EQ(monitor->applicationStateForBundleIdentifier(""), kApplicationUnknown);
}

TEST(HeadlessRenderServer, AContextBelongsToTheProcessOfItsNumber) {
  HeadlessPlatform platform({});
  EXPECT_EQ(platform.renderServer().ownerOfContext(static_cast<uint32_t>(::getpid())), ::getpid());
  EXPECT_FALSE(platform.renderServer().ownerOfContext(0));
  EXPECT_FALSE(platform.renderServer().ownerOfContext(0x7FFFFFFF));
  EXPECT_FALSE(platform.renderServer().ownerOfContext(0xFFFFFFFF));
}

class SampleRecorder final : public CaptureOutputDelegate {
 public:
  void captureOutputDidOutputSampleBuffer(const CaptureOutput& output, const SampleBufferRef& sample) override {
    std::unique_lock lock(mutex_);
    samples_.push_back(sample);
    output_ = &output;
    lock.unlock();
    if (onSample) onSample();
    changed_.notify_all();
  }
  std::vector<SampleBufferRef> waitForSamples(size_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return samples_.size() >= count; });
    return samples_;
  }
  size_t count() {
    std::lock_guard lock(mutex_);
    return samples_.size();
  }
  std::function<void()> onSample;
  const CaptureOutput* output_ = nullptr;

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<SampleBufferRef> samples_;
};

TEST(HeadlessMicrophone, DeliversOnTheQueueUntilItsOutputIsRemoved) {
  HeadlessPlatform platform({});
  auto& service = platform.deviceCapture();
  SerialQueue queue("test");
  SampleRecorder recorder;
  const auto session = service.createSession();
  const auto input = service.createDefaultAudioInput();
  const auto output = service.createAudioDataOutput();
  std::promise<void> running;
  session->setRunningObserver([&] { running.set_value(); });
  output->setSampleDelegate(&recorder, &queue);
  EXPECT_FALSE(session->canAddInput(nullptr));
  session->addInput(input);
  EXPECT_FALSE(session->canAddInput(service.createDefaultAudioInput())) << "a second one of its kind";
  ASSERT_TRUE(session->canAddOutput(output));
  session->addOutput(output);
  recorder.onSample = [&] { EXPECT_TRUE(queue.isOnQueue()); };
  session->startRunning();
  running.get_future().wait();
  EXPECT_TRUE(session->isRunning());
  const auto samples = recorder.waitForSamples(50);
  session->removeInput(input);
  session->removeOutput(output);
  const size_t after = recorder.count();
  queue.sync([] {});
  EXPECT_EQ(recorder.count(), after);
  EXPECT_EQ(recorder.output_, output.get());

  size_t loud = 0;
  for (size_t i = 0; i < samples.size(); ++i) {
    EXPECT_EQ(samples[i]->numSamples(), 1024);
    const auto begin = static_cast<uint64_t>(samples[i]->presentationTime().value);
    for (size_t frame = 0; frame < 1024; ++frame) {
      const uint8_t* bytes = samples[i]->data()->bytes().data() + 2 * frame;
      const auto sample = static_cast<int16_t>(bytes[0] << 8 | bytes[1]);
      // A time rounded twice may be a nanosecond or two off.
      const int16_t expected = testsignal::beepSample(begin + frame * 1'000'000'000 / 44100, 440);
      ASSERT_NEAR(sample, expected, 1);
      loud += std::abs(sample) > 8000;
    }
    if (i > 0) {
      EXPECT_NEAR(static_cast<double>(begin) - static_cast<double>(samples[i - 1]->presentationTime().value),
                  1024 / 44100.0 * 1e9, 2);
    }
  }
  EXPECT_GT(loud, 1000u);
  // The observer lives in this function: let go of it on the session's thread before leaving.
  session->setRunningObserver(nullptr);
}

TEST(HeadlessMicrophone, RemovalFromACallbackAndAbsence) {
  HeadlessPlatform platform({});
  auto& service = platform.deviceCapture();
  SerialQueue queue("test");
  SampleRecorder recorder;
  const auto session = service.createSession();
  const auto output = service.createAudioDataOutput();
  output->setSampleDelegate(&recorder, &queue);
  recorder.onSample = [&] { session->removeOutput(output); };
  session->addInput(service.createDefaultAudioInput());
  session->addOutput(output);
  session->startRunning();
  recorder.waitForSamples(1);
  session->stopRunning();
  queue.sync([] {});
  EXPECT_EQ(recorder.count(), 1u);

  HeadlessPlatform without({.hasMicrophone = false});
  EXPECT_FALSE(without.deviceCapture().createDefaultAudioInput());
}

TEST(HeadlessAudioSession, InterruptionsReachTheObserver) {
  HeadlessPlatform platform({});
  std::vector<uint32_t> seen;
  platform.deviceCapture().audioSession().setInterruptionObserver([&](uint32_t type) { seen.push_back(type); });
  platform.deviceCapture().postInterruption(AudioSessionInterruption::Began);
  platform.deviceCapture().postInterruption(AudioSessionInterruption::Ended);
  EXPECT_EQ(seen, (std::vector<uint32_t>{1, 0}));
}

}  // namespace
}  // namespace qv::platform
