#pragma once

#include <sys/types.h>

#include <functional>
#include <map>
#include <optional>

#include "platform/pulse/PulseConnection.h"

namespace qv::platform {

/// Whose process plays a stream, as far as the sound server knows.
///
/// PulseAudio does not know: a stream's process is what its client says. A PipeWire server takes each client's process
/// from the socket, and what it says of one goes before whatever that claims. But its Pulse clients are all behind one
/// process that speaks for them, and which this service's own connection is behind as well; those are believed as on
/// PulseAudio.
///
/// Threading: the connection's thread.
class PulseClients {
 public:
  struct Events {
    std::function<void()> learned;  ///< streams whose process was not known may be asked for anew
    std::function<void()> failed;   ///< the server did not say what it knows
  };
  explicit PulseClients(Events events) : events_(std::move(events)) {}

  /// Asks what kind of server it is; until `learned` is called no stream's process is known.
  void ready(pa_context* context);
  void lost();
  /// A client has come or changed or, with `isGone`, went. A stream may be seen before its client.
  void changed(uint32_t client, bool isGone);

  /// 0 where it has none; nothing as long as it is not known.
  std::optional<pid_t> processOf(const pa_sink_input_info& input) const;

 private:
  void foundOwn(const pa_client_info* own);
  void found(const pa_client_info& client);

  const Events events_;
  pa_context* context_ = nullptr;   // while connected
  std::optional<pid_t> spokesman_;  // the process behind which Pulse clients are; 0 where the server vouches for none
  std::map<uint32_t, pid_t> vouched_;
};

}  // namespace qv::platform
