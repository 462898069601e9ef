#include "platform/pulse/PulseClients.h"

#include <cstdlib>

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

/// Of a client, by the server. Of a stream it would be its client's own word.
constexpr const char* kVouchedProcess = "pipewire.sec.pid";

pid_t processIn(const pa_proplist* properties, const char* key) {
  const char* text = pa_proplist_gets(properties, key);
  return text == nullptr ? 0 : static_cast<pid_t>(std::strtol(text, nullptr, 10));
}

}  // namespace

void PulseClients::ready(pa_context* context) {
  context_ = context;
  const auto found = [](pa_context*, const pa_client_info* client, int end, void* self) {
    if (end <= 0) static_cast<PulseClients*>(self)->foundOwn(end == 0 ? client : nullptr);
  };
  dropOperation(pa_context_get_client_info(context, pa_context_get_index(context), found, this));
}

void PulseClients::lost() {
  context_ = nullptr;
  spokesman_.reset();
  vouched_.clear();
}

void PulseClients::foundOwn(const pa_client_info* own) {
  if (own == nullptr) {
    QV_LOG_ERROR(logs::kAudio, "the sound server does not know this client: %s",
                 pa_strerror(pa_context_errno(context_)));
    events_.failed();
    return;
  }
  // A PulseAudio server would hand on what other clients say under this key, but this one says nothing.
  spokesman_ = processIn(own->proplist, kVouchedProcess);
  if (*spokesman_ == 0) {
    events_.learned();
    return;
  }
  const auto found = [](pa_context*, const pa_client_info* client, int end, void* self) {
    if (end == 0) static_cast<PulseClients*>(self)->found(*client);
    if (end > 0) static_cast<PulseClients*>(self)->events_.learned();
  };
  dropOperation(pa_context_get_client_info_list(context_, found, this));
}

void PulseClients::found(const pa_client_info& client) {
  vouched_[client.index] = processIn(client.proplist, kVouchedProcess);
}

void PulseClients::changed(uint32_t client, bool isGone) {
  if (isGone) vouched_.erase(client);
  if (isGone || spokesman_.value_or(0) == 0 || vouched_.contains(client)) return;
  // Fails where it has gone meanwhile, with its streams.
  const auto found = [](pa_context*, const pa_client_info* info, int end, void* self) {
    if (end == 0) static_cast<PulseClients*>(self)->found(*info);
    if (end > 0) static_cast<PulseClients*>(self)->events_.learned();
  };
  dropOperation(pa_context_get_client_info(context_, client, found, this));
}

std::optional<pid_t> PulseClients::processOf(const pa_sink_input_info& input) const {
  if (!spokesman_) return std::nullopt;
  if (*spokesman_ != 0) {
    const auto client = vouched_.find(input.client);
    if (client == vouched_.end()) return std::nullopt;
    if (client->second != *spokesman_) return client->second;
  }
  return processIn(input.proplist, PA_PROP_APPLICATION_PROCESS_ID);
}

}  // namespace qv::platform
