#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/Extensions.h"
#include "platform/SerialQueue.h"
#include "platform/linux/ExtensionProcess.h"
#include "platform/linux/LinuxBundleService.h"

namespace qv::platform {

/// Extensions as bundles below the bundle roots whose Info.json has the section of `extensioninfo`; each runs in a
/// confined process of its own (docs/broadcast-extensions.md).
///
/// Nothing of the search is kept: what is installed or removed is seen at once. Of several bundles with one identifier
/// the first by path counts. Destroying the service kills the processes; requests that are open then are not answered.
///
/// Threading: as ExtensionService; destroy it from no handler.
class LinuxExtensionService final : public ExtensionService {
 public:
  /// The services are borrowed.
  LinuxExtensionService(IPCService& ipc, LinuxBundleService& bundles, TimerService& timers, Executor& executor,
                        ExtensionLaunchOptions options);
  ~LinuxExtensionService() override;

  void extensionsMatchingAttributes(
      const Dictionary& attributes,
      std::function<void(const std::vector<ExtensionRecordRef>&, const std::optional<Error>&)> completion) override;
  void setHostContextClass(const std::string& extensionPointIdentifier,
                           std::function<std::shared_ptr<ExtensionHostContext>()> make) override;
  void beginExtensionRequest(const ExtensionRecordRef& extension, std::vector<ExtensionItem> inputItems,
                             ExtensionRequestHandlers handlers) override;
  [[nodiscard]] std::shared_ptr<ExtensionHostContext> contextForRequest(ExtensionRequestID request) override;
  [[nodiscard]] std::shared_ptr<IPCConnection> auxiliaryConnectionForRequest(ExtensionRequestID request) override;
  void killExtension(const ExtensionRecordRef& extension, int signal) override;
  [[nodiscard]] std::optional<std::string> issueSandboxToken(const std::string& tokenClass, const std::string& path,
                                                             const ExtensionRecordRef& extension) override;
  void revokeSandboxToken(const std::string& token) override;

 private:
  /// The processes of one extension: the last takes requests, those before it are dying.
  ///
  /// Threading: `queue` only.
  struct Processes {
    explicit Processes(Executor& executor)
        : queue(std::make_shared<SerialQueue>("com.tarnwick.quorveld.extension", executor)) {}
    const std::shared_ptr<SerialQueue> queue;
    std::vector<std::shared_ptr<ExtensionProcess>> all;
  };

  std::shared_ptr<Processes> processesOf(const std::string& identifier);
  static ExtensionProcess& processForRequests(const std::shared_ptr<ExtensionHost>& host,
                                              const std::shared_ptr<Processes>& processes,
                                              const ExtensionRecordRef& extension);

  LinuxBundleService& bundles_;
  const std::shared_ptr<ExtensionHost> host_;
  std::atomic<ExtensionRequestID> lastRequest_{0};
  std::mutex mutex_;
  std::map<std::string, std::shared_ptr<Processes>> processes_;  ///< by extension identifier, under the mutex
};

}  // namespace qv::platform
