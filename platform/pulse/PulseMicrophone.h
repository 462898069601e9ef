#pragma once

#include "platform/pulse/PulseConnection.h"
#include "platform/pulse/PulseTrack.h"
#include "platform/sound/PCMSource.h"

namespace qv::platform {

/// The server's default source; silence while there is none. What a server offers as the default
/// where it knows no microphone, the monitor of an output, does not count as one.
///
/// Threading: as PCMSource; the track lives on the connection's thread.
class PulseMicrophone final : public PCMSource {
 public:
  PulseMicrophone(const std::string& server, const PCMFormat& format);
  std::chrono::nanoseconds latency() const override;
  void awaitSound(uint64_t hostTime) override;
  void render(uint64_t hostTime, std::span<int16_t> samples) override;

 private:
  void ready(pa_context* context);
  void lost();
  void open(pa_context* context, const pa_source_info* source);
  void trackEnded();

  const PCMFormat format_;
  const std::shared_ptr<MixTimeline> timeline_;
  std::unique_ptr<PulseTrack> track_;
  PulseConnection connection_;  // last: ends first
};

/// The source that servers take for the default one.
inline constexpr const char kPulseDefaultSource[] = "@DEFAULT_SOURCE@";
inline bool isMicrophone(const pa_source_info& source) { return source.monitor_of_sink == PA_INVALID_INDEX; }

}  // namespace qv::platform
