#pragma once

#include <optional>

#include "platform/IPC.h"
#include "sdk/client/quorvel/Recorder.h"
#include "sdk/common/ValueCoding.h"

namespace qv::client {

// Between what crosses the connection and the application's types. What arrives may be malformed in
// ways that its wire type allows: such a sample is nothing, such a field is its default.

using sdk::fromWire;
using sdk::toWire;

/// The start request's arguments; nothing when the endpoint's descriptor cannot be duplicated.
std::optional<platform::IPCArguments> startArguments(const quorvel::StartOptions& options);
std::optional<quorvel::Error> errorFromWire(const platform::Value& value);
quorvel::State stateFromWire(const platform::Dictionary& dictionary);
quorvel::BroadcastExtension extensionFromWire(const platform::Dictionary& dictionary);

/// Of captureHandlerWithSample and captureHandlerWithAudioSample.
std::optional<quorvel::VideoFrame> videoFrameFromWire(const platform::IPCArguments& arguments);
std::optional<quorvel::AudioSample> audioSampleFromWire(const platform::IPCArguments& arguments);

}  // namespace qv::client
