#pragma once

#include "platform/IPC.h"

namespace qv::platform::test {

/// An interface with an operation of each kind.
inline const IPCInterface& testInterface() {
  using Signatures = std::vector<std::string>;
  static const IPCInterface interface {
    "com.tarnwick.quorveld.Test", {
      {"echo", {"v"}, {"value"}, Signatures{"v"}, {"value"}},
          {"everything",
           {"b", "i", "u", "x", "t", "d", "s", "ay", "a{sv}", "au", "(dd)", "aa{sv}", "ah"},
           {"boolean", "signed", "unsigned", "wide", "wideUnsigned", "real", "text", "data", "dictionary", "numbers",
            "pair", "dictionaries", "descriptors"},
           Signatures{"b", "i", "u", "x", "t", "d", "s", "ay", "a{sv}", "au", "(dd)", "aa{sv}", "ah"},
           {}},
          {"nothing", {}, {}, Signatures{}, {}}, {"notify", {"u"}, {"number"}, std::nullopt, {}},
          {"sample", {"u", "ay"}, {"number", "bytes"}, std::nullopt, {}, true},
          {"frame", {"(hhuuuu)", "ay"}, {"sample", "timing"}, std::nullopt, {}, true},
    }
  };
  return interface;
}

}  // namespace qv::platform::test
