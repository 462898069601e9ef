#pragma once

#include <memory>
#include <vector>

#include "platform/linux/LinuxExtensionProcess.h"

namespace qv::platform {

/// The processes of one use: the last takes requests, those before it are dying. It is kept by the host until the use
/// has ended and the last of them is dead.
///
/// Threading: `queue` only, other than where it says so.
class ExtensionProcesses : public std::enable_shared_from_this<ExtensionProcesses> {
 public:
  static constexpr size_t kMaximumUses = 8;  // of one extension, those counted whose processes still die

  /// Any thread. Already kept by the host.
  static std::shared_ptr<ExtensionProcesses> create(std::shared_ptr<ExtensionHost> host, ExtensionRecordRef extension);
  void begin(ExtensionRequestID request, std::vector<ExtensionItem> items, ExtensionRequestHandlers handlers);
  void endUse();
  /// Kills what still runs, and waits for its end.
  void endAtOnce();

  const std::shared_ptr<SerialQueue> queue;
  const std::shared_ptr<SandboxTokenBook> tokens = std::make_shared<SandboxTokenBook>();  ///< any thread

 private:
  ExtensionProcesses(const std::shared_ptr<ExtensionHost>& host, ExtensionRecordRef extension);
  LinuxExtensionProcess& processForRequests();
  void processEnded(const LinuxExtensionProcess* ended);
  void leaveWhenDead();

  const std::weak_ptr<ExtensionHost> host_;  ///< which keeps this
  const ExtensionRecordRef extension_;
  bool isBeyondBound_ = false;
  bool hasEnded_ = false;
  std::vector<std::shared_ptr<LinuxExtensionProcess>> all_;
};

/// Threading: as ExtensionUse.
class LinuxExtensionUse final : public ExtensionUse {
 public:
  LinuxExtensionUse(std::shared_ptr<ExtensionHost> host, ExtensionRecordRef extension);
  ~LinuxExtensionUse() override;
  LinuxExtensionUse(const LinuxExtensionUse&) = delete;
  LinuxExtensionUse& operator=(const LinuxExtensionUse&) = delete;

  void beginRequest(std::vector<ExtensionItem> inputItems, ExtensionRequestHandlers handlers) override;
  [[nodiscard]] std::optional<std::string> issueSandboxToken(const std::string& tokenClass,
                                                             const std::string& path) override;
  void revokeSandboxToken(const std::string& token) override;

 private:
  const std::shared_ptr<ExtensionHost> host_;
  const std::shared_ptr<ExtensionProcesses> processes_;
};

}  // namespace qv::platform
