#pragma once

#include <gtest/gtest.h>

#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "tests/kit/Process.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::kit {

/// Who serves PulseAudio clients.
enum class SoundServerKind { PulseAudio, PipeWire };
std::ostream& operator<<(std::ostream& out, SoundServerKind kind);
/// The programs that it takes.
std::vector<const char*> programsOf(SoundServerKind kind);

/// A private sound server with two outputs ("appout", "other") and a microphone that hears what is played into
/// "micsrc".
///
/// Threading: one thread.
class SoundServer {
 public:
  explicit SoundServer(SoundServerKind kind);
  ~SoundServer() { stop(); }
  [[nodiscard]] std::string address() const { return "unix:" + folder_ / "socket"; }
  /// After a kill.
  void start();
  void kill();
  /// Moves all that plays to another output.
  [[nodiscard]] bool moveStreams(const std::string& output);

 private:
  void stop();

  const SoundServerKind kind_;
  ScratchFolder folder_;
  std::optional<Process> process_;
};

/// A process, or with `playsInChild` the child of one, that plays tones; see TonePlayer.cpp.
///
/// Threading: one thread.
class TonePlayer {
 public:
  explicit TonePlayer(const SoundServer& server, bool playsInChild = false, std::vector<std::string> environment = {});
  [[nodiscard]] pid_t pid() const { return process_.pid(); }
  /// Silent streams into an output, one for each frequency ("440 1500").
  [[nodiscard]] bool open(const std::string& output, const std::string& frequencies);
  /// Lets its streams sound; the host time at which they begin, 0 where the player has died.
  [[nodiscard]] uint64_t sound();

 private:
  Process process_;
};

/// A program that plays a tone for a minute, by libpipewire itself, into the default output of the newest PipeWire
/// server.
///
/// Threading: one thread.
class NativePlayer {
 public:
  /// With what its stream says of itself: "NAME = VALUE ...".
  explicit NativePlayer(int frequency, const std::string& properties = {});
  [[nodiscard]] pid_t pid() const { return process_->pid(); }

 private:
  ScratchFolder folder_;
  std::optional<Process> process_;
};

/// Skips, visibly, where there is no sound server to start. One server for each case.
///
/// Threading: one thread.
class SoundServerTest : public ::testing::TestWithParam<SoundServerKind> {
 protected:
  void SetUp() override {
    for (const char* program : programsOf(GetParam()))
      if (!isInstalled(program)) GTEST_SKIP() << program << " is not installed";
    server_.emplace(GetParam());
  }
  std::optional<SoundServer> server_;
};

}  // namespace qv::kit
