#include "extensions/QVExtensionHostContext.h"

#include "platform/threads/Log.h"
#include "protocol/QVBroadcastProtocols.h"

namespace qv {

void QVExtensionHostContext::registerWith(platform::ExtensionService& extensions) {
  for (const char* point : {broadcastpoint::kUpload, broadcastpoint::kGeneral}) {
    extensions.setHostContextClass(point, [] { return std::make_shared<QVExtensionHostContext>(); });
  }
}

const platform::IPCInterface& QVExtensionHostContext::_extensionAuxiliaryHostProtocol() const {
  return extensionHostProtocol();
}

const platform::IPCInterface& QVExtensionHostContext::_extensionAuxiliaryVendorProtocol() const {
  return extensionVendorProtocol();
}

void QVExtensionHostContext::didConnectToVendor(const std::shared_ptr<platform::IPCConnection>&) {
  QV_LOG(platform::logs::kExtensions, "Connected to extension.");
}

}  // namespace qv
