#include "platform/pulse/PulseConnection.h"

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr pa_usec_t kRetryInterval = PA_USEC_PER_SEC;

}  // namespace

void PulseDeleter::operator()(pa_context* context) const {
  pa_context_set_state_callback(context, nullptr, nullptr);
  pa_context_set_subscribe_callback(context, nullptr, nullptr);
  pa_context_disconnect(context);
  pa_context_unref(context);
}

PulsePointer<pa_context> makePulseContext(pa_mainloop_api* api) {
  const PulsePointer<pa_proplist> properties(pa_proplist_new());
  pa_proplist_sets(properties.get(), PA_PROP_APPLICATION_NAME, "quorveld");
  pa_proplist_sets(properties.get(), PA_PROP_APPLICATION_ID, "com.tarnwick.quorveld");
  return PulsePointer<pa_context>(pa_context_new_with_proplist(api, "quorveld", properties.get()));
}

PulseConnection::PulseConnection(std::string server, Events events)
    : server_(std::move(server)), events_(std::move(events)), loop_(pa_threaded_mainloop_new()) {
  if (!loop_) {
    QV_LOG_ERROR(logs::kAudio, "out of descriptors: no connection to the sound server");
    return;
  }
  pa_threaded_mainloop_set_name(loop_.get(), "qv-pulse");
  pa_threaded_mainloop_start(loop_.get());
  pa_threaded_mainloop_lock(loop_.get());
  connect();
  pa_threaded_mainloop_unlock(loop_.get());
}

PulseConnection::~PulseConnection() {
  if (!loop_) return;
  pa_threaded_mainloop_lock(loop_.get());
  disconnect();
  if (timer_ != nullptr) pa_threaded_mainloop_get_api(loop_.get())->time_free(timer_);
  pa_threaded_mainloop_unlock(loop_.get());
  pa_threaded_mainloop_stop(loop_.get());
}

void PulseConnection::connect() {
  context_ = makePulseContext(pa_threaded_mainloop_get_api(loop_.get()));
  const auto changed = [](pa_context*, void* self) { static_cast<PulseConnection*>(self)->contextChanged(); };
  pa_context_set_state_callback(context_.get(), changed, this);
  // Where no server listens this fails at once, and no event ever comes.
  if (pa_context_connect(context_.get(), server_.empty() ? nullptr : server_.c_str(), PA_CONTEXT_NOAUTOSPAWN, nullptr) <
      0) {
    schedule();
  }
}

void PulseConnection::disconnect() {
  events_.lost();
  context_.reset();
}

void PulseConnection::contextChanged() {
  const pa_context_state_t state = pa_context_get_state(context_.get());
  if (state == PA_CONTEXT_READY) {
    QV_LOG_INFO(logs::kAudio, "connected to the sound server");
    events_.ready(context_.get());
  } else if (!PA_CONTEXT_IS_GOOD(state)) {
    QV_LOG_INFO(logs::kAudio, "sound server lost: %s", pa_strerror(pa_context_errno(context_.get())));
    events_.lost();
    schedule();
  }
}

void PulseConnection::schedule() {
  if (timer_ != nullptr) return;
  const auto fired = [](pa_mainloop_api*, pa_time_event*, const timeval*, void* self) {
    static_cast<PulseConnection*>(self)->timerFired();
  };
  timer_ = pa_context_rttime_new(context_.get(), pa_rtclock_now() + kRetryInterval, fired, this);
}

void PulseConnection::timerFired() {
  pa_threaded_mainloop_get_api(loop_.get())->time_free(timer_);
  timer_ = nullptr;
  if (pa_context_get_state(context_.get()) == PA_CONTEXT_READY) {
    events_.ready(context_.get());
    return;
  }
  disconnect();
  connect();
}

}  // namespace qv::platform
