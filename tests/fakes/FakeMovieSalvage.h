#pragma once

#include <cerrno>
#include <map>
#include <string>
#include <vector>

#include "platform/MovieSalvage.h"

namespace qv::fakes {

/// Files are by their names what the test says, and no movies otherwise; salvage gives the same length each time.
class FakeMovieSalvage final : public platform::MovieSalvage {
 public:
  platform::Result<platform::MovieState> stateOfMovie(const std::string& path) override {
    const auto it = states.find(nameOf(path));
    if (it == states.end()) return platform::Error::posix(EINVAL, path);
    return it->second;
  }
  platform::Result<platform::MediaTime> salvageMovie(const std::string& path) override {
    salvaged.push_back(nameOf(path));
    return length;
  }
  std::map<std::string, platform::MovieState> states;
  platform::Result<platform::MediaTime> length = platform::MediaTime::make(3, 2);
  std::vector<std::string> salvaged;

 private:
  static std::string nameOf(const std::string& path) { return path.substr(path.rfind('/') + 1); }
};

}  // namespace qv::fakes
