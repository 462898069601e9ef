#include "platform/pulse/PulseTapSource.h"

#include <cstdlib>
#include <fstream>
#include <string>

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr int kDeepestDescent = 64;

/// 0 where the process is gone.
pid_t parentOf(pid_t process) {
  std::ifstream file("/proc/" + std::to_string(process) + "/stat");
  std::string line;
  std::getline(file, line);
  // "pid (name) state parent ...", where a name may hold anything.
  const size_t afterName = line.rfind(')');
  if (afterName == std::string::npos || afterName + 4 > line.size()) return 0;
  return static_cast<pid_t>(std::strtol(line.c_str() + afterName + 4, nullptr, 10));
}

}  // namespace

bool isSameOrDescendant(pid_t process, pid_t ancestor) {
  for (int depth = 0; depth < kDeepestDescent && process > 1; ++depth) {
    if (process == ancestor) return true;
    process = parentOf(process);
  }
  return process == ancestor;
}

PulseTapSource::PulseTapSource(const std::string& server, pid_t process, const PCMFormat& format)
    : process_(process),
      format_(format),
      timeline_(std::make_shared<MixTimeline>(format.sampleRate)),
      clients_({.learned = [this] { requestInputs(); }, .failed = [this] { connection_.retryLater(); }}),
      connection_(server, {.ready = [this](pa_context* context) { ready(context); }, .lost = [this] { lost(); }}) {}

void PulseTapSource::render(uint64_t hostTime, std::span<int16_t> samples) {
  timeline_->read(hostTime, format_.channels, samples);
}

void PulseTapSource::ready(pa_context* context) {
  context_ = context;
  // Subscribed before any list is asked for, so that no stream falls between the two.
  pa_context_set_subscribe_callback(
      context,
      [](pa_context*, pa_subscription_event_type_t type, uint32_t index, void* self) {
        static_cast<PulseTapSource*>(self)->changed(type, index);
      },
      this);
  constexpr int kMask = PA_SUBSCRIPTION_MASK_SINK_INPUT | PA_SUBSCRIPTION_MASK_CLIENT;
  dropOperation(pa_context_subscribe(context, static_cast<pa_subscription_mask_t>(kMask), nullptr, nullptr));
  clients_.ready(context);
}

void PulseTapSource::changed(pa_subscription_event_type_t type, uint32_t index) {
  const bool isGone = (type & PA_SUBSCRIPTION_EVENT_TYPE_MASK) == PA_SUBSCRIPTION_EVENT_REMOVE;
  if ((type & PA_SUBSCRIPTION_EVENT_FACILITY_MASK) == PA_SUBSCRIPTION_EVENT_CLIENT) {
    clients_.changed(index, isGone);
  } else if (!isGone) {
    requestInput(index);
  }
}

void PulseTapSource::lost() {
  tracks_.clear();
  clients_.lost();
  context_ = nullptr;
}

void PulseTapSource::requestInputs() {
  const auto found = [](pa_context*, const pa_sink_input_info* input, int end, void* self) {
    if (end == 0) static_cast<PulseTapSource*>(self)->considerInput(*input);
  };
  dropOperation(pa_context_get_sink_input_info_list(context_, found, this));
}

void PulseTapSource::requestInput(uint32_t index) {
  const auto found = [](pa_context*, const pa_sink_input_info* input, int end, void* self) {
    if (end == 0) static_cast<PulseTapSource*>(self)->considerInput(*input);
  };
  dropOperation(pa_context_get_sink_input_info(context_, index, found, this));
}

void PulseTapSource::considerInput(const pa_sink_input_info& input) {
  const uint32_t index = input.index;
  const pid_t player = clients_.processOf(input).value_or(0);
  if (tracks_.contains(index) || !isSameOrDescendant(player, process_)) return;
  auto track = std::make_unique<PulseTrack>(context_, PulseTrack::Target{index, {}}, timeline_,
                                            [this, index] { trackEnded(index); });
  if (!track->isConnecting()) {
    QV_LOG_ERROR(logs::kAudio, "stream %u cannot be tapped: %s", index, pa_strerror(pa_context_errno(context_)));
    return;
  }
  QV_LOG_INFO(logs::kAudio, "tapping stream %u of process %d", index, player);
  tracks_.emplace(index, std::move(track));
}

/// A stream also ends when its input moves to another device: then it is still there.
void PulseTapSource::trackEnded(uint32_t index) {
  const auto track = tracks_.extract(index);
  if (!track.empty() && track.mapped()->hasBegun() && context_ != nullptr) requestInput(index);
}

}  // namespace qv::platform
