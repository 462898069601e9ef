#include "platform/linux/LinuxExtensionService.h"

#include <cerrno>
#include <set>
#include <utility>

#include "platform/Log.h"
#include "platform/linux/ExtensionManifest.h"

namespace qv::platform {
namespace {

constexpr const char kReadOnlyTokenClass[] = "com.tarnwick.quorveld.read-only";

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
      host_(new ExtensionHost{.ipc = ipc, .timers = timers, .executor = executor, .options = std::move(options)}) {}

LinuxExtensionService::~LinuxExtensionService() {
  for (const auto& [identifier, processes] : processes_) {
    processes->queue->sync([&] { processes->all.clear(); });
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

std::shared_ptr<LinuxExtensionService::Processes> LinuxExtensionService::processesOf(const std::string& identifier) {
  std::lock_guard lock(mutex_);
  auto& processes = processes_[identifier];
  if (!processes) processes = std::make_shared<Processes>(host_->executor);
  return processes;
}

ExtensionProcess& LinuxExtensionService::processForRequests(const std::shared_ptr<ExtensionHost>& host,
                                                            const std::shared_ptr<Processes>& processes,
                                                            const ExtensionRecordRef& extension) {
  auto& all = processes->all;
  if (all.empty() || all.back()->isEnding()) {
    all.push_back(ExtensionProcess::create(
        host, processes->queue, extension, [weak = std::weak_ptr(processes)](ExtensionProcess* ended) {
          // Not within its own call.
          if (const auto strong = weak.lock()) {
            strong->queue->async(weak, [ended](Processes& of) {
              std::erase_if(of.all, [&](const auto& process) { return process.get() == ended; });
            });
          }
        }));
  }
  return *all.back();
}

void LinuxExtensionService::beginExtensionRequest(const ExtensionRecordRef& extension,
                                                  std::vector<ExtensionItem> inputItems,
                                                  ExtensionRequestHandlers handlers) {
  const ExtensionRequestID request = ++lastRequest_;
  const auto processes = processesOf(extension->identifier);
  processes->queue->async(
      std::weak_ptr(processes), [host = host_, weak = std::weak_ptr(processes), extension, request,
                                 items = std::move(inputItems), handlers = std::move(handlers)](Processes&) mutable {
        processForRequests(host, weak.lock(), extension).begin(request, std::move(items), std::move(handlers));
      });
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

void LinuxExtensionService::killExtension(const ExtensionRecordRef& extension, int signal) {
  const auto processes = processesOf(extension->identifier);
  processes->queue->async(std::weak_ptr(processes), [signal](Processes& of) {
    if (!of.all.empty()) of.all.back()->sendSignal(signal);
  });
}

std::optional<std::string> LinuxExtensionService::issueSandboxToken(const std::string& tokenClass,
                                                                    const std::string& path,
                                                                    const ExtensionRecordRef& extension) {
  if (tokenClass != kReadOnlyTokenClass) return std::nullopt;
  return host_->tokens.issue(path, extension->identifier);
}

void LinuxExtensionService::revokeSandboxToken(const std::string& token) { host_->tokens.revoke(token); }

}  // namespace qv::platform
