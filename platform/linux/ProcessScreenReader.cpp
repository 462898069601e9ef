#include "platform/linux/ProcessScreenReader.h"

#include <filesystem>
#include <fstream>
#include <system_error>

namespace qv::platform {

bool ProcessScreenReader::isRunning() {
  std::error_code error;
  for (std::filesystem::directory_iterator entry("/proc", error), end; !error && entry != end; entry.increment(error)) {
    std::ifstream file(entry->path() / "comm");
    std::string name;
    if (std::getline(file, name) && names_.contains(name)) return true;
  }
  return false;
}

}  // namespace qv::platform
