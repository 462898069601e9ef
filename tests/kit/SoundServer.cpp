#include "tests/kit/SoundServer.h"

#include <stdlib.h>
#include <unistd.h>

#include <stdexcept>

namespace qv::kit {

std::ostream& operator<<(std::ostream& out, SoundServerKind kind) {
  return out << (kind == SoundServerKind::PipeWire ? "PipeWire" : "PulseAudio");
}

std::vector<const char*> programsOf(SoundServerKind kind) {
  if (kind == SoundServerKind::PulseAudio) return {"pulseaudio"};
  return {"pipewire", "pipewire-pulse", "wireplumber", "pw-cat", "dbus-daemon", "pactl"};
}

SoundServer::SoundServer(SoundServerKind kind) : kind_(kind) {
  // The last command answers when the socket is there, and with it everything else.
  folder_.write("/script.pa",
                "load-module module-null-sink norewinds=1 sink_name=appout\n"
                "load-module module-null-sink norewinds=1 sink_name=other\n"
                "load-module module-null-sink norewinds=1 sink_name=micsrc\n"
                "load-module module-remap-source master=micsrc.monitor source_name=mic\n"
                "set-default-sink appout\n"
                "set-default-source mic\n"
                "load-module module-native-protocol-unix auth-anonymous=1 socket=" +
                    folder_ / "socket" + "\nlist-cards\n");
  // Clients look for their cookie there, too.
  ::setenv("HOME", folder_.path().c_str(), 1);
  ::setenv("XDG_RUNTIME_DIR", folder_.path().c_str(), 1);
  start();
}

void SoundServer::start() {
  if (kind_ == SoundServerKind::PipeWire) {
    process_.emplace(PIPEWIRE_PROGRAM, std::vector<std::string>{folder_.path(), folder_ / "socket"});
    if (!process_->awaitLine("ready")) throw std::runtime_error("pipewire did not start");
    return;
  }
  process_.emplace("sh",
                   std::vector<std::string>{"-c",
                                            "exec pulseaudio -n --daemonize=no --exit-idle-time=-1 --disallow-exit=yes "
                                            "--use-pid-file=no -F " +
                                                folder_ / "script.pa" + " 2>&1"});
  if (!process_->awaitLine("E: [pulseaudio] main.c: 0 card(s) available."))
    throw std::runtime_error("pulseaudio did not start");
}

void SoundServer::kill() {
  process_.reset();
  ::unlink((folder_ / "socket").c_str());
}

void SoundServer::stop() {
  if (process_) process_->stop();
}

bool SoundServer::moveStreams(const std::string& output) {
  Process move(
      "sh", {"-ec", "for i in $(pactl list short sink-inputs | cut -f1); do pactl move-sink-input $i $0; done", output},
      {"PULSE_SERVER=" + address()});
  return move.wait() == 0;
}

TonePlayer::TonePlayer(const SoundServer& server, bool playsInChild, std::vector<std::string> environment)
    : process_(TONE_PLAYER_PROGRAM, {server.address(), playsInChild ? "--fork" : "--stay"}, std::move(environment)) {}

bool TonePlayer::open(const std::string& output, const std::string& frequencies) {
  return process_.say("open " + output + " " + frequencies) && process_.readLine() == "opened";
}

uint64_t TonePlayer::sound() {
  const std::string answer = process_.say("sound") ? process_.readLine() : "";
  return answer.empty() ? 0 : std::stoull(answer);
}

NativePlayer::NativePlayer(int frequency, const std::string& properties) {
  const std::string file = folder_ / "tone.wav";
  // Without the volume its amplitude is 4095.
  Process maker("ffmpeg", {"-v", "error", "-f", "lavfi", "-i",
                           "sine=" + std::to_string(frequency) + ":r=44100:d=60,volume=8000/4095", file});
  if (maker.wait() != 0) throw std::runtime_error("no tone to play");
  process_.emplace("pw-cat", std::vector<std::string>{"--playback", "--properties", "{ " + properties + " }", file});
}

}  // namespace qv::kit
