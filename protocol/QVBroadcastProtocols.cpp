#include "protocol/QVBroadcastProtocols.h"

namespace qv {

using platform::IPCInterface;

const IPCInterface& broadcastDaemonProtocol() {
  static const IPCInterface interface =
      broadcastcall::All::interface("com.tarnwick.quorveld.QVBroadcastDaemonProtocol");
  return interface;
}

const IPCInterface& broadcastExtensionProtocol() {
  static const IPCInterface interface =
      CallList<broadcastcall::ProcessPayload>::interface("com.tarnwick.quorveld.QVBroadcastExtensionProtocol");
  return interface;
}

const IPCInterface& extensionVendorProtocol() {
  static const IPCInterface interface =
      CallList<broadcastcall::SetEndpoint>::interface("com.tarnwick.quorveld.QVExtensionVendorProtocol");
  return interface;
}

const IPCInterface& extensionHostProtocol() {
  static const IPCInterface interface = CallList<>::interface("com.tarnwick.quorveld.QVExtensionHostProtocol");
  return interface;
}

}  // namespace qv
