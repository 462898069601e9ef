#include "platform/IPC.h"

#include <algorithm>

namespace qv::platform {

const IPCOperation* IPCInterface::operation(std::string_view member) const {
  const auto it = std::find_if(operations.begin(), operations.end(),
                               [&](const IPCOperation& candidate) { return candidate.member == member; });
  return it == operations.end() ? nullptr : &*it;
}

}  // namespace qv::platform
