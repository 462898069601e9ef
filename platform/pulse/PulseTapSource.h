#pragma once

#include <sys/types.h>

#include <map>

#include "platform/pulse/PulseClients.h"
#include "platform/pulse/PulseConnection.h"
#include "platform/pulse/PulseTrack.h"
#include "platform/sound/PCMSource.h"

namespace qv::platform {

/// While it goes on, sound is handed on this long after it was played: servers deliver it in fragments of
/// 20 ms, with some delay when a stream begins (100 ms have been seen).
inline constexpr std::chrono::milliseconds kPulseLatency{120};
/// How long an end waits for sound: a stream that runs is a fragment behind at most. (A PulseAudio server's
/// null output was seen to deliver commonly 12 ms before the sound is heard, on a busy machine up to 20 ms after.)
inline constexpr std::chrono::milliseconds kPulsePatience{40};

/// What a process and its descendants play, summed.
///
/// The processes of streams are those that the server vouches for, where it does (see PulseClients).
///
/// Threading: as PCMSource; tracks live on the connection's thread.
class PulseTapSource final : public PCMSource {
 public:
  PulseTapSource(const std::string& server, pid_t process, const PCMFormat& format);
  std::chrono::nanoseconds latency() const override { return kPulseLatency; }
  void awaitSound(uint64_t hostTime) override { timeline_->await(hostTime, kPulseLatency, kPulsePatience); }
  void render(uint64_t hostTime, std::span<int16_t> samples) override;

 private:
  void ready(pa_context* context);
  void lost();
  void changed(pa_subscription_event_type_t type, uint32_t index);
  void requestInputs();
  void requestInput(uint32_t index);
  void considerInput(const pa_sink_input_info& input);
  void trackEnded(uint32_t index);

  const pid_t process_;
  const PCMFormat format_;
  const std::shared_ptr<MixTimeline> timeline_;
  pa_context* context_ = nullptr;  // while connected
  PulseClients clients_;
  std::map<uint32_t, std::unique_ptr<PulseTrack>> tracks_;
  PulseConnection connection_;  // last: ends first
};

/// Whether `process` is `ancestor` or descends from it.
bool isSameOrDescendant(pid_t process, pid_t ancestor);

}  // namespace qv::platform
