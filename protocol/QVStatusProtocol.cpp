#include "protocol/QVStatusProtocol.h"

namespace qv {

const platform::IPCInterface& statusProtocol() {
  static const platform::IPCInterface interface = status::All::interface("com.tarnwick.quorveld.Status");
  return interface;
}

}  // namespace qv
