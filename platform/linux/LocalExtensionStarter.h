#pragma once

#include <memory>

#include "platform/linux/ExtensionCgroups.h"
#include "platform/linux/ExtensionLaunch.h"
#include "platform/linux/ExtensionStarter.h"
#include "platform/linux/ExtensionUsers.h"

namespace qv::platform {

/// Starts extensions as children of this process: as users of the reserved range where it is root, else as its own.
///
/// Threading: as ExtensionStarter.
class LocalExtensionStarter final : public ExtensionStarter {
 public:
  explicit LocalExtensionStarter(ExtensionLaunchOptions options);
  Result<std::unique_ptr<StartedExtension>> start(const ExtensionRecord& extension, const ExtensionEndpoints& endpoints,
                                                  StartedExtensionHandlers handlers) override;

 private:
  const ExtensionLaunchOptions options_;
  ExtensionUsers users_;
  ExtensionCgroups cgroups_;
};

}  // namespace qv::platform
