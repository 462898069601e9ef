#include "platform/process/LateModule.h"

#include <dlfcn.h>

#include <cerrno>
#include <cstring>
#include <string>

namespace qv::platform {

std::filesystem::path pathOfModule(const std::filesystem::path& directory, const char* module) {
  namespace fs = std::filesystem;
  if (!directory.empty()) return directory / module;
  std::error_code error;
  const fs::path own = fs::read_symlink("/proc/self/exe", error).parent_path();
  return fs::exists(own / module, error) ? own / module : own / "../lib/quorveld" / module;
}

Result<void*> entryOfModule(const std::filesystem::path& path, const char* entry) {
  void* module = ::dlopen(path.c_str(), RTLD_LAZY | RTLD_LOCAL);
  const auto* abi = module != nullptr ? static_cast<const char*>(::dlsym(module, "qvModuleABI")) : nullptr;
  const bool isOurs = abi != nullptr && std::strcmp(abi, QV_MODULE_ABI) == 0;
  void* function = isOurs ? ::dlsym(module, entry) : nullptr;
  if (function != nullptr) return function;
  const char* why = abi != nullptr && !isOurs ? "of another build than the daemon" : ::dlerror();
  const std::string text = path.string() + ": " + (why != nullptr ? why : "unusable");
  return Error{"module", ENOENT, {{kLocalizedDescriptionKey, Value(text)}}};
}

}  // namespace qv::platform
