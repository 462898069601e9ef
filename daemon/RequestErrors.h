#pragma once

/// Names of the D-Bus errors with which a call fails whose completion handler is never called, so
/// that no client waits for ever.
namespace qv::requesterror {

/// A stop while nothing records.
inline constexpr const char kNotRecording[] = "com.tarnwick.quorveld.Error.NotRecording";
/// A discard during a recording.
inline constexpr const char kRecording[] = "com.tarnwick.quorveld.Error.Recording";
inline constexpr const char kNotSupported[] = "com.tarnwick.quorveld.Error.NotSupported";

}  // namespace qv::requesterror
