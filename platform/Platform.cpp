#include "platform/Platform.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>

namespace qv::platform {
namespace {
std::atomic<Platform*> installed{nullptr};
}

Platform& Platform::current() {
  Platform* platform = installed.load(std::memory_order_acquire);
  if (platform == nullptr) {
    std::fputs("no platform is installed\n", stderr);
    std::abort();
  }
  return *platform;
}

void Platform::install(Platform* platform) { installed.store(platform, std::memory_order_release); }

std::string pathUnderDeviceRoot(const std::string& path) { return Platform::current().deviceRoot + path; }

}  // namespace qv::platform
