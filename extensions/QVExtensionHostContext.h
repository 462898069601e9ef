#pragma once

#include "platform/Extensions.h"

namespace qv {

/// The daemon's side of the auxiliary connection with a broadcast extension's process: it names the two interfaces.
///
/// Threading: immutable, so thread-safe.
class QVExtensionHostContext final : public platform::ExtensionHostContext {
 public:
  /// Makes these the host contexts of the broadcast extension points.
  static void registerWith(platform::ExtensionService& extensions);

  [[nodiscard]] const platform::IPCInterface& _extensionAuxiliaryHostProtocol() const override;
  [[nodiscard]] const platform::IPCInterface& _extensionAuxiliaryVendorProtocol() const override;
  void didConnectToVendor(const std::shared_ptr<platform::IPCConnection>& vendor) override;
};

}  // namespace qv
