#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/Extensions.h"
#include "platform/linux/ExtensionHost.h"
#include "platform/linux/LinuxBundleService.h"

namespace qv::platform {

/// Extensions as bundles below the bundle roots whose Info.json has the section of `extensioninfo`; each runs in a
/// confined process of its own (docs/broadcast-extensions.md).
///
/// What is installed or removed is seen at once. Of several bundles with one identifier the first by path counts.
/// Destroying the service kills the processes; requests that are open then are not answered, and what is left of uses
/// does nothing any more.
///
/// Threading: as ExtensionService; destroy it from no handler.
class LinuxExtensionService final : public ExtensionService {
 public:
  /// The services are borrowed.
  LinuxExtensionService(IPCService& ipc, LinuxBundleService& bundles, TimerService& timers, Executor& executor,
                        std::unique_ptr<ExtensionStarter> starter);
  ~LinuxExtensionService() override;

  void extensionsMatchingAttributes(
      const Dictionary& attributes,
      std::function<void(const std::vector<ExtensionRecordRef>&, const std::optional<Error>&)> completion) override;
  void setHostContextClass(const std::string& extensionPointIdentifier,
                           std::function<std::shared_ptr<ExtensionHostContext>()> make) override;
  [[nodiscard]] std::shared_ptr<ExtensionUse> useExtension(const ExtensionRecordRef& extension) override;
  [[nodiscard]] std::shared_ptr<ExtensionHostContext> contextForRequest(ExtensionRequestID request) override;
  [[nodiscard]] std::shared_ptr<IPCConnection> auxiliaryConnectionForRequest(ExtensionRequestID request) override;

 private:
  LinuxBundleService& bundles_;
  const std::shared_ptr<ExtensionHost> host_;
};

}  // namespace qv::platform
