#pragma once

#include "protocol/Calls.h"

namespace qv {

/// What whoever may connect can ask the daemon without changing anything. What each answers is in docs/protocol.md.
const platform::IPCInterface& statusProtocol();

namespace status {

struct GetRecordings : NoArguments {
  static constexpr const char kMember[] = "getRecordings";
  static constexpr const char kReply[] = "aa{sv} recordings";
};

struct GetStartConditions {
  static constexpr const char kMember[] = "getStartConditions";
  static constexpr const char kReply[] = "aa{sv} conditions";
  std::string bundleID;
  bool systemRecording = false, microphoneEnabled = false;
  static constexpr auto arguments() {
    using Call = GetStartConditions;
    return std::tuple{Argument{"bundleID", &Call::bundleID}, Argument{"systemRecording", &Call::systemRecording},
                      Argument{"microphoneEnabled", &Call::microphoneEnabled}};
  }
};

struct GetMovies : NoArguments {
  static constexpr const char kMember[] = "getMovies";
  static constexpr const char kReply[] = "aa{sv} movies";
};

struct GetDevice : NoArguments {
  static constexpr const char kMember[] = "getDevice";
  static constexpr const char kReply[] = "a{sv} device";
};

using All = CallList<GetRecordings, GetStartConditions, GetMovies, GetDevice>;

}  // namespace status
}  // namespace qv
