#pragma once

#include <gtest/gtest.h>
#include <sys/types.h>

#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

#include "platform/AppAudioTap.h"
#include "platform/DeviceCapture.h"
#include "platform/base/FileDescriptor.h"

namespace qv::platform {

/// A process that plays tones; see TonePlayer.cpp.
class TonePlayer {
 public:
  explicit TonePlayer(const std::string& server, bool playsInChild = false);
  ~TonePlayer();
  TonePlayer(const TonePlayer&) = delete;
  TonePlayer& operator=(const TonePlayer&) = delete;
  [[nodiscard]] pid_t pid() const { return pid_; }
  /// Sends a line and waits for the answer; empty when the player has died.
  std::string tell(const std::string& line);
  /// Lets its tones sound; the host time at which they begin.
  uint64_t sound();

 private:
  FileDescriptor input_;
  FileDescriptor output_;
  pid_t pid_ = 0;
};

/// Captured mono sound, in order, that a test waits for.
///
/// Threading: thread-safe.
class Capture {
 public:
  void add(uint64_t hostTime, const uint8_t* bigEndian, size_t frames);
  /// Waits until a tone of `frequency` makes up a block of 100 ms that was captured from now on.
  /// False after 20 s.
  bool waitForTone(double frequency);
  /// Waits for `frames` more and returns them.
  std::vector<int16_t> next(size_t frames);
  /// The host time of the first sample of more than a tenth of the players' amplitude; 0 without.
  uint64_t firstSound();
  /// The host time at which what was captured so far ends; 0 before.
  uint64_t end();
  /// The samples from a host time on, or all where it began later.
  std::vector<int16_t> from(uint64_t hostTime);
  [[nodiscard]] bool isContinuous();

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<int16_t> samples_;
  std::vector<std::pair<size_t, uint64_t>> starts_;  // index and host time of each part
};

/// The amplitude of one frequency in samples at 44.1 kHz.
double amplitudeOf(double frequency, std::span<const int16_t> samples);

/// A private sound server with two outputs ("appout", "other") and a microphone that hears what is
/// played into "micsrc". Cases are skipped where pulseaudio is not installed.
class PulseTest : public testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;
  void startServer();
  void killServer();
  /// Taps a process into `capture` until the queue is destroyed.
  std::unique_ptr<AppAudioTapQueue> tap(AppAudioTapService& service, pid_t process, Capture& capture);
  [[nodiscard]] std::string server() const { return "unix:" + directory_ + "/socket"; }

 private:
  std::string directory_;
  pid_t serverPid_ = 0;
};

}  // namespace qv::platform
