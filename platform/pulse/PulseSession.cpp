#include "platform/pulse/PulseSession.h"

#include <algorithm>

#include "platform/pulse/PulseMicrophone.h"

namespace qv::platform {

using std::chrono::steady_clock;

PulseSession::PulseSession(const std::string& server, std::chrono::milliseconds limit)
    : end_(steady_clock::now() + limit),
      loop_(pa_mainloop_new()),
      context_(loop_ ? makePulseContext(pa_mainloop_get_api(loop_.get())) : nullptr),
      connected_(connect(server)) {}

bool PulseSession::connect(const std::string& server) {
  const char* address = server.empty() ? nullptr : server.c_str();
  if (!context_ || pa_context_connect(context_.get(), address, PA_CONTEXT_NOAUTOSPAWN, nullptr) < 0) return false;
  return runUntil([this] { return pa_context_get_state(context_.get()) == PA_CONTEXT_READY; });
}

bool PulseSession::runUntil(const std::function<bool()>& done) {
  while (!done()) {
    if (!PA_CONTEXT_IS_GOOD(pa_context_get_state(context_.get()))) return false;
    const auto left = std::chrono::duration_cast<std::chrono::microseconds>(end_ - steady_clock::now());
    if (left.count() <= 0) return false;
    if (pa_mainloop_prepare(loop_.get(), static_cast<int>(left.count())) < 0) return false;
    if (pa_mainloop_poll(loop_.get()) < 0 || pa_mainloop_dispatch(loop_.get()) < 0) return false;
  }
  return true;
}

bool serverHasMicrophone(const std::string& server) {
  struct Answer {
    bool isComplete = false;
    bool hasMicrophone = false;
  } answer;
  PulseSession session(server, std::chrono::seconds(1));
  if (!session.isConnected()) return false;
  const auto found = [](pa_context*, const pa_source_info* source, int end, void* data) {
    auto& result = *static_cast<Answer*>(data);
    if (end == 0) result.hasMicrophone = isMicrophone(*source);
    if (end != 0) result.isComplete = true;
  };
  dropOperation(pa_context_get_source_info_by_name(session.context(), kPulseDefaultSource, found, &answer));
  return session.runUntil([&] { return answer.isComplete; }) && answer.hasMicrophone;
}

}  // namespace qv::platform
