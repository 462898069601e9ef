#pragma once

#include <optional>

#include "protocol/QVDaemonProtocol.h"
#include "sdk/client/quorvel/Recorder.h"
#include "sdk/common/ValueCoding.h"

namespace qv::client {

// Between what crosses the connection and the application's types. What arrives may be malformed in
// ways that its wire type allows: such a field is its default.

using sdk::fromWire;
using sdk::toWire;

/// Nothing when the endpoint's descriptor cannot be duplicated.
std::optional<request::StartRecording> startRequest(const quorvel::StartOptions& options);
std::optional<quorvel::Error> errorFromWire(const platform::Dictionary& dictionary);
quorvel::State stateFromWire(const platform::Dictionary& dictionary);
quorvel::BroadcastExtension extensionFromWire(const platform::Dictionary& dictionary);

}  // namespace qv::client
