#pragma once

#include <filesystem>

#include "platform/base/Error.h"
#include "platform/base/Result.h"

namespace qv::platform {

/// Where a module stands: in `directory`; where that is empty beside the executable, or in ../lib/quorveld
/// from there.
std::filesystem::path pathOfModule(const std::filesystem::path& directory, const char* module);

/// The function of this name in a module. The module is loaded for good, and bound lazily: a daemon that has
/// recorded is two megabytes smaller for it. An error, in the loader's words, where it cannot be loaded, and where
/// the headers of the contracts were others when it was built: a call into it would not fail cleanly.
///
/// Threading: thread-safe, blocking (tens of milliseconds and more).
Result<void*> entryOfModule(const std::filesystem::path& path, const char* entry);

}  // namespace qv::platform

/// Marks what a module shows to the daemon.
#define QV_MODULE_EXPORT extern "C" __attribute__((visibility("default")))
/// Once in each module: of which build it is.
#define QV_MODULE_DEFINE_ABI QV_MODULE_EXPORT const char qvModuleABI[] = QV_MODULE_ABI
