#include "protocol/QVDaemonProtocol.h"

namespace qv {

const platform::IPCInterface& daemonProtocol() {
  static const platform::IPCInterface interface = request::All::interface("com.tarnwick.quorveld.QVDaemonProtocol");
  return interface;
}

}  // namespace qv
