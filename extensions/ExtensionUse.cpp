#include "extensions/ExtensionUse.h"

#include <csignal>
#include <map>
#include <mutex>
#include <string>

#include "platform/Platform.h"

namespace qv {
namespace {

struct Uses {
  std::mutex mutex;
  std::map<std::string, std::weak_ptr<ExtensionUse>> byIdentifier;
};

/// Never destroyed: uses may end with the process.
Uses& uses() {
  static auto* const all = new Uses;
  return *all;
}

}  // namespace

std::shared_ptr<ExtensionUse> ExtensionUse::of(const platform::ExtensionRecordRef& extension) {
  std::lock_guard lock(uses().mutex);
  auto& known = uses().byIdentifier[extension->identifier];
  auto use = known.lock();
  if (!use) known = use = std::make_shared<ExtensionUse>(extension);
  return use;
}

ExtensionUse::~ExtensionUse() {
  std::lock_guard lock(uses().mutex);
  const auto known = uses().byIdentifier.find(extension_->identifier);
  // A new use may have begun while this one ended.
  if (known != uses().byIdentifier.end() && !known->second.expired()) return;
  if (known != uses().byIdentifier.end()) uses().byIdentifier.erase(known);
  platform::Platform::current().extensions->killExtension(extension_, SIGKILL);
}

}  // namespace qv
