#pragma once

#include <string>

namespace qv {

/// What a hostile extension tries, by name: "ok", or "errno N" where the kernel said no. Runs in the extension.
std::string attack(const std::string& name, const std::string& argument);

}  // namespace qv
