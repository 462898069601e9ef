#include "platform/Platform.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>

namespace qv::platform {
namespace {
std::atomic<Platform*> installed{nullptr};
std::atomic<uint64_t> installations{0};
}  // namespace

Platform& Platform::current() {
  Platform* platform = installed.load(std::memory_order_acquire);
  if (platform == nullptr) {
    std::fputs("no platform is installed\n", stderr);
    std::abort();
  }
  return *platform;
}

void Platform::install(Platform* platform) {
  installed.store(platform, std::memory_order_release);
  installations.fetch_add(1, std::memory_order_acq_rel);
}

uint64_t Platform::installation() { return installations.load(std::memory_order_acquire); }

std::string pathUnderDeviceRoot(const std::string& path) { return Platform::current().deviceRoot + path; }

}  // namespace qv::platform
