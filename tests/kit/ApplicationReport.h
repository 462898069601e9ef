#pragma once

#include <cstdint>
#include <ostream>
#include <string>

#include "platform/Applications.h"

namespace qv::kit {

/// What a report of a state monitor says.
struct ApplicationReport {
  static ApplicationReport decode(const platform::Dictionary& report) {
    using namespace platform;
    return {valueForKey(report, applicationstate::kBundleIDKey).asString(),
            valueForKey(report, applicationstate::kProcessIDKey).asInteger(),
            valueForKey(report, applicationstate::kIsFrontmostKey).asBool(),
            valueForKey(report, applicationstate::kStateKey).asInteger()};
  }
  bool operator==(const ApplicationReport&) const = default;

  std::string bundleID;
  int64_t process = 0;
  bool isFrontmost = false;
  int64_t state = 0;
};
inline std::ostream& operator<<(std::ostream& out, const ApplicationReport& report) {
  return out << report.bundleID << " " << report.process << " state " << report.state
             << (report.isFrontmost ? " in front" : "");
}

}  // namespace qv::kit
