#pragma once

#include <gtest/gtest.h>

#include <optional>
#include <string>

#include "tests/kit/Process.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::kit {

/// A private PulseAudio with two outputs ("appout", "other") and a microphone that hears what is played into "micsrc".
///
/// Threading: one thread.
class SoundServer {
 public:
  SoundServer();
  ~SoundServer() { stop(); }
  [[nodiscard]] std::string address() const { return "unix:" + folder_ / "socket"; }
  /// After a kill.
  void start();
  void kill();
  /// Moves all that plays to another output.
  [[nodiscard]] bool moveStreams(const std::string& output);

 private:
  void stop();

  ScratchFolder folder_;
  std::optional<Process> process_;
};

/// A process, or with `playsInChild` the child of one, that plays tones; see TonePlayer.cpp.
///
/// Threading: one thread.
class TonePlayer {
 public:
  explicit TonePlayer(const SoundServer& server, bool playsInChild = false);
  [[nodiscard]] pid_t pid() const { return process_.pid(); }
  /// Silent streams into an output, one for each frequency ("440 1500").
  [[nodiscard]] bool open(const std::string& output, const std::string& frequencies);
  /// Lets its streams sound; the host time at which they begin, 0 where the player has died.
  [[nodiscard]] uint64_t sound();

 private:
  Process process_;
};

/// Skips, visibly, where there is no sound server to start. One server for each case.
///
/// Threading: one thread.
class SoundServerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!isInstalled("pulseaudio")) GTEST_SKIP() << "pulseaudio is not installed";
    server_.emplace();
  }
  std::optional<SoundServer> server_;
};

}  // namespace qv::kit
