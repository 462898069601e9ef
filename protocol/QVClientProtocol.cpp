#include "protocol/QVClientProtocol.h"

namespace qv {

const platform::IPCInterface& clientProtocol() {
  static const platform::IPCInterface interface = callback::All::interface("com.tarnwick.quorveld.QVClientProtocol");
  return interface;
}

}  // namespace qv
