#pragma once

namespace qv::platform::launcher {

/// All but the address space, which this program still needs. `hasOwnUser`: threads are counted by user, so that those
/// of another user's are none of the extension's. Throws std::system_error.
void setLimits(bool hasOwnUser);
/// The last limit. Throws std::system_error.
void limitAddressSpace();

}  // namespace qv::platform::launcher
