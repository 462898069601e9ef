#include "platform/linux/LinuxExtensionService.h"

#include <utility>

#include "platform/linux/InstalledExtensions.h"
#include "platform/linux/LinuxExtensionUse.h"

namespace qv::platform {
LinuxExtensionService::LinuxExtensionService(IPCService& ipc, LinuxBundleService& bundles, TimerService& timers,
                                             Executor& executor, std::unique_ptr<ExtensionStarter> starter)
    : bundles_(bundles),
      host_(new ExtensionHost{.ipc = ipc, .timers = timers, .executor = executor, .starter = std::move(starter)}) {}

LinuxExtensionService::~LinuxExtensionService() {
  for (const auto& processes : host_->uses.exchange({})) {
    processes->queue->sync([&] { processes->endAtOnce(); });
  }
}

void LinuxExtensionService::extensionsMatchingAttributes(
    const Dictionary& attributes,
    std::function<void(const std::vector<ExtensionRecordRef>&, const std::optional<Error>&)> completion) {
  host_->executor.post([&bundles = bundles_, point = valueForKey(attributes, extensioninfo::kPointIdentifier),
                        completion = std::move(completion)] {
    auto extensions = installedExtensions(bundles);
    std::erase_if(extensions, [&](const ExtensionRecordRef& extension) {
      return !point.isNone() && point.asString() != extension->extensionPointIdentifier;
    });
    if (completion) completion(extensions, std::nullopt);
  });
}

void LinuxExtensionService::setHostContextClass(const std::string& extensionPointIdentifier,
                                                std::function<std::shared_ptr<ExtensionHostContext>()> make) {
  host_->contextClasses.with([&](auto& classes) { classes[extensionPointIdentifier] = std::move(make); });
}

std::shared_ptr<ExtensionUse> LinuxExtensionService::useExtension(const ExtensionRecordRef& extension) {
  return std::make_shared<LinuxExtensionUse>(host_, extension);
}

std::shared_ptr<ExtensionHostContext> LinuxExtensionService::contextForRequest(ExtensionRequestID request) {
  return host_->places.with([&](auto& places) {
    const auto it = places.find(request);
    return it == places.end() ? nullptr : it->second.context;
  });
}

std::shared_ptr<IPCConnection> LinuxExtensionService::auxiliaryConnectionForRequest(ExtensionRequestID request) {
  return host_->places.with([&](auto& places) {
    const auto it = places.find(request);
    return it == places.end() ? nullptr : it->second.auxiliary;
  });
}

}  // namespace qv::platform
