#include "protocol/QVBroadcastProtocols.h"

namespace qv {

using platform::IPCInterface;

const IPCInterface& broadcastDaemonProtocol() {
  static const IPCInterface interface {
    "com.tarnwick.quorveld.QVBroadcastDaemonProtocol", {
      {"ping", {}, {}, std::nullopt, {}}, {"updateServiceInfo", {"a{sv}"}, {"serviceInfo"}, std::nullopt, {}},
          {"updateBroadcastURL", {"s"}, {"broadcastURL"}, std::nullopt, {}}, {
        "finishBroadcastWithError", {"a{sv}"}, {"error"}, std::nullopt, {}
      }
    }
  };
  return interface;
}

const IPCInterface& broadcastExtensionProtocol() {
  static const IPCInterface interface {
    "com.tarnwick.quorveld.QVBroadcastExtensionProtocol", {
      {
        "processPayload", {"a{sv}"}, {"payload"}, std::vector<std::string>{}, {}
      }
    }
  };
  return interface;
}

const IPCInterface& extensionVendorProtocol() {
  static const IPCInterface interface {
    "com.tarnwick.quorveld.QVExtensionVendorProtocol", {
      {
        "setEndpoint", {"h"}, {"endpoint"}, std::vector<std::string>{}, {}
      }
    }
  };
  return interface;
}

const IPCInterface& extensionHostProtocol() {
  static const IPCInterface interface {
    "com.tarnwick.quorveld.QVExtensionHostProtocol", {}
  };
  return interface;
}

}  // namespace qv
