#include "daemon/ServicesLook.h"

#include <utility>

namespace qv {

void ServicesLook::look(Handler handler) {
  waiting_.push_back(std::move(handler));
  if (waiting_.size() > 1) return;
  platform_.backgroundQueue->post([weakSelf = weak_from_this(), query = platform_.services, &sequence = sequence_] {
    // Whoever asked has a daemon that still lives.
    if (weakSelf.expired()) return;
    sequence.async(weakSelf, [services = query->look()](ServicesLook& self) { self.found(services); });
  });
}

void ServicesLook::found(const platform::DeviceServices& services) {
  for (const Handler& handler : std::exchange(waiting_, {})) handler(services);
}

}  // namespace qv
