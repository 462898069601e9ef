#pragma once

#include <cerrno>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/MovieSalvage.h"

namespace qv::fakes {

/// Files are by their names what the test says; salvage gives the same length each time.
class FakeMovieSalvage final : public platform::MovieSalvage {
 public:
  platform::Result<platform::MovieState> stateOfMovie(const std::string& path) override {
    if (damaged.contains(nameOf(path))) return platform::Error{"movie", 1, {}};
    const auto it = states.find(nameOf(path));
    if (it != states.end()) return it->second;
    if (others) return *others;
    return platform::Error::posix(EINVAL, path);
  }
  platform::Result<platform::MediaTime> salvageMovie(const std::string& path) override {
    salvaged.push_back(nameOf(path));
    return length;
  }
  std::map<std::string, platform::MovieState> states;
  std::optional<platform::MovieState> others;  ///< no movies without
  std::set<std::string> damaged;
  platform::Result<platform::MediaTime> length = platform::MediaTime::make(3, 2);
  std::vector<std::string> salvaged;

 private:
  static std::string nameOf(const std::string& path) { return path.substr(path.rfind('/') + 1); }
};

}  // namespace qv::fakes
