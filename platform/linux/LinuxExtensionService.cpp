#include "platform/linux/LinuxExtensionService.h"

#include <unistd.h>

#include <set>
#include <utility>

#include "platform/linux/ExtensionManifest.h"
#include "platform/linux/LinuxExtensionUse.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

std::vector<ExtensionRecordRef> findExtensions(LinuxBundleService& bundles, const Value& point) {
  std::vector<ExtensionRecordRef> extensions;
  std::set<std::string> identifiers;
  for (const BundleRef& bundle : bundles.installedBundles()) {
    if (!isExtensionInfo(bundle->infoDictionary())) continue;
    auto record = makeExtensionRecord(*bundle);
    if (!record) {
      QV_LOG_ERROR(logs::kExtensions, "extension %s is left out: %s", bundle->path().c_str(),
                   record.error().description().c_str());
    } else if (!identifiers.insert((*record)->identifier).second) {
      QV_LOG_ERROR(logs::kExtensions, "extension %s is left out: another one is %s", bundle->path().c_str(),
                   (*record)->identifier.c_str());
    } else if (point.isNone() || point.asString() == (*record)->extensionPointIdentifier) {
      extensions.push_back(std::move(*record));
    }
  }
  return extensions;
}

}  // namespace

LinuxExtensionService::LinuxExtensionService(IPCService& ipc, LinuxBundleService& bundles, TimerService& timers,
                                             Executor& executor, ExtensionLaunchOptions options)
    : bundles_(bundles),
      host_(new ExtensionHost{.ipc = ipc, .timers = timers, .executor = executor, .options = std::move(options)}) {
  if (::geteuid() == 0) return;
  QV_LOG(
      logs::kExtensions,
      "the daemon is not root: extensions run as its own user, without a bound of threads, a view of their own of the "
      "files, or protection of containers from each other but Landlock; the other bounds hold");
}

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
    const auto extensions = findExtensions(bundles, point);
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
