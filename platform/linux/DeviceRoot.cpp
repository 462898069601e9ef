#include "platform/linux/DeviceRoot.h"

#include <cstdlib>

namespace qv::platform {
namespace {

std::string environment(const char* name) {
  const char* value = std::getenv(name);
  return value ? value : "";
}

}  // namespace

std::string deviceRootFromEnvironment() {
  std::string root = environment("QUORVEL_DEVICE_ROOT");
  while (root.ends_with('/')) root.pop_back();
  return root;
}

std::string bundlePathFromEnvironment() { return environment("QUORVEL_BUNDLE_PATH"); }

}  // namespace qv::platform
