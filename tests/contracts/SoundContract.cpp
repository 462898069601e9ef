#include <unistd.h>

#include <atomic>
#include <thread>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/pulse/PulsePlatform.h"
#include "platform/threads/Clock.h"
#include "tests/contracts/Backends.h"
#include "tests/kit/Events.h"
#include "tests/kit/SoundRecorder.h"
#include "tests/kit/SoundServer.h"

namespace qv::contracts {
namespace {

using namespace platform;

constexpr uint64_t kFrame = 1'000'000'000 / kit::kSoundRate;  // nanoseconds

uint64_t now() { return static_cast<uint64_t>(systemClock().hostTime().value); }

/// A process that can be tapped, and a microphone.
struct SoundStage {
  virtual ~SoundStage() = default;
  virtual AppAudioTapService& taps() = 0;
  virtual DeviceCaptureService& devices() = 0;
};

class HeadlessStage final : public SoundStage {
  AppAudioTapService& taps() override { return platform_.appAudioTap(); }
  DeviceCaptureService& devices() override { return platform_.deviceCapture(); }
  HeadlessPlatform platform_{{}};
};

template <kit::SoundServerKind kKind>
class PulseStage final : public SoundStage {
  AppAudioTapService& taps() override { return platform_->appAudioTap(); }
  DeviceCaptureService& devices() override { return platform_->deviceCapture(); }
  kit::SoundServer server_{kKind};
  const std::unique_ptr<PulsePlatform> platform_ = std::move(PulsePlatform::connect(server_.address()).value());
};

template <kit::SoundServerKind kKind>
Backend<SoundStage> pulse(const char* name) {
  return {name, make<SoundStage, PulseStage<kKind>>, kit::programsOf(kKind)};
}

const auto kBackends = testing::Values(Backend<SoundStage>{"headless", make<SoundStage, HeadlessStage>},
                                       pulse<kit::SoundServerKind::PulseAudio>("pulse"),
                                       pulse<kit::SoundServerKind::PipeWire>("pipewire"));

class AppAudioTapContract : public ContractTest<SoundStage> {};
INSTANTIATE_TEST_SUITE_P(, AppAudioTapContract, kBackends, kNameOfBackend);

TEST_P(AppAudioTapContract, RunsOnTheHostClockFromItsStartToItsStop) {
  kit::TestTap tap(stage_->taps(), ::getpid());
  std::atomic<int> changes = 0;
  std::atomic<bool> isOwnThread = true;
  tap.queue().addIsRunningListener([&, test = std::this_thread::get_id()] {
    ++changes;
    if (std::this_thread::get_id() == test) isOwnThread = false;
  });
  const uint64_t begin = now();
  ASSERT_EQ(tap.queue().start(), 0);
  ASSERT_FALSE(tap.sound.next(kit::kSoundRate / 2).empty()) << "nothing plays";
  EXPECT_EQ(changes, 1);
  const uint64_t beforeStop = now();
  ASSERT_EQ(tap.queue().stop(), 0);
  EXPECT_EQ(changes, 2);
  EXPECT_TRUE(isOwnThread);
  EXPECT_GE(tap.sound.begin(), begin);
  EXPECT_GE(tap.sound.end() + 2 * kFrame, beforeStop);
  EXPECT_LE(tap.sound.end(), now());
  EXPECT_TRUE(tap.sound.isContinuous());

  ASSERT_EQ(tap.queue().start(), 0);
  ASSERT_FALSE(tap.sound.next(1).empty());
  EXPECT_EQ(changes, 3);
  ASSERT_EQ(tap.queue().removeIsRunningListener(), 0);
  ASSERT_EQ(tap.queue().dispose(), 0);
  EXPECT_EQ(changes, 3);
  EXPECT_NE(tap.queue().start(), 0);
}

TEST_P(AppAudioTapContract, AStopWaitsForACallbackOrComesFromOne) {
  kit::TestTap tap(stage_->taps(), ::getpid());
  std::atomic<bool> isInside = false;
  tap.onBuffer = [&] {
    isInside = true;
    for (int i = 0; i < 1000; ++i) std::this_thread::yield();
    isInside = false;
  };
  for (int round = 0; round < 5; ++round) {
    ASSERT_EQ(tap.queue().start(), 0);
    tap.sound.next(1);
    ASSERT_EQ(tap.queue().stop(), 0);
    ASSERT_FALSE(isInside);
  }
  tap.onBuffer = [&] { EXPECT_EQ(tap.queue().stop(), 0); };
  const size_t before = tap.sound.parts();
  ASSERT_EQ(tap.queue().start(), 0);
  ASSERT_TRUE(tap.sound.waitForParts(before + 1));
  ASSERT_EQ(tap.queue().dispose(), 0);
  EXPECT_EQ(tap.sound.parts(), before + 1) << "none came after the stop";
}

class MicrophoneContract : public ContractTest<SoundStage> {};
INSTANTIATE_TEST_SUITE_P(, MicrophoneContract, kBackends, kNameOfBackend);

TEST_P(MicrophoneContract, DeliversFromItsStartToItsStopWhileItHasInputAndOutput) {
  kit::TestMicrophone microphone(stage_->devices());
  auto& session = *microphone.session;
  kit::Events<bool> changes;
  session.setRunningObserver([&] { changes.add(session.isRunning()); });
  EXPECT_FALSE(session.canAddInput(nullptr));
  EXPECT_FALSE(session.canAddInput(stage_->devices().createDefaultAudioInput())) << "a second one of its kind";
  EXPECT_FALSE(session.canAddOutput(stage_->devices().createAudioDataOutput()));
  const uint64_t begin = now();
  session.startRunning();
  EXPECT_TRUE(changes.next());
  ASSERT_FALSE(microphone.sound.next(kit::kSoundRate / 2).empty());
  const uint64_t beforeStop = now();
  microphone.stop();
  EXPECT_FALSE(changes.next());
  EXPECT_GE(microphone.sound.begin(), begin);
  EXPECT_GE(microphone.sound.end() + 2 * kFrame, beforeStop);
  EXPECT_TRUE(microphone.sound.isContinuous());

  session.startRunning();
  ASSERT_FALSE(microphone.sound.next(1).empty());
  session.removeInput(microphone.input);
  session.removeOutput(microphone.output);
  const size_t after = microphone.sound.parts();
  microphone.queue.sync([] {});
  EXPECT_EQ(microphone.sound.parts(), after);
  // The observer lives in this function: let go of it on the session's thread before leaving.
  session.setRunningObserver(nullptr);
  EXPECT_TRUE(changes.next());
}

TEST_P(MicrophoneContract, ACallbackMayRemoveItsOutput) {
  kit::TestMicrophone microphone(stage_->devices());
  microphone.onSample = [&] { microphone.session->removeOutput(microphone.output); };
  microphone.session->startRunning();
  ASSERT_TRUE(microphone.sound.waitForParts(1));
  microphone.stop();
  EXPECT_EQ(microphone.sound.parts(), 1u);
}

}  // namespace
}  // namespace qv::contracts
