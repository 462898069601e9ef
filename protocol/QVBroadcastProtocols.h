#pragma once

#include "protocol/Calls.h"

/// The interfaces between the daemon and a broadcast upload extension, and the vocabulary of what they carry. The
/// extension library speaks them too.
namespace qv {

/// Exported by the daemon to the extension. All operations are one-way.
const platform::IPCInterface& broadcastDaemonProtocol();
/// Exported by the extension.
const platform::IPCInterface& broadcastExtensionProtocol();
/// Exported by the extension on the auxiliary connection of a request.
const platform::IPCInterface& extensionVendorProtocol();
/// Exported by the daemon on that connection; it has no operations.
const platform::IPCInterface& extensionHostProtocol();

namespace broadcastcall {

struct Ping : NoArguments {
  static constexpr const char kMember[] = "ping";
};
struct UpdateServiceInfo {
  static constexpr const char kMember[] = "updateServiceInfo";
  platform::Dictionary serviceInfo;
  static constexpr auto arguments() { return std::tuple{Argument{"serviceInfo", &UpdateServiceInfo::serviceInfo}}; }
};
struct UpdateBroadcastURL {
  static constexpr const char kMember[] = "updateBroadcastURL";
  platform::URL broadcastURL;
  static constexpr auto arguments() { return std::tuple{Argument{"broadcastURL", &UpdateBroadcastURL::broadcastURL}}; }
};
struct FinishBroadcastWithError {
  static constexpr const char kMember[] = "finishBroadcastWithError";
  platform::Dictionary error;  ///< encoded
  static constexpr auto arguments() { return std::tuple{Argument{"error", &FinishBroadcastWithError::error}}; }
};
using All = CallList<Ping, UpdateServiceInfo, UpdateBroadcastURL, FinishBroadcastWithError>;

/// Answered when the payload was processed. SampleCoding.h makes and reads payloads.
struct ProcessPayload {
  static constexpr const char kMember[] = "processPayload";
  static constexpr const char kReply[] = "";
  platform::Dictionary payload;
  static constexpr auto arguments() { return std::tuple{Argument{"payload", &ProcessPayload::payload}}; }
};

struct SetEndpoint {
  static constexpr const char kMember[] = "setEndpoint";
  static constexpr const char kReply[] = "";
  platform::SharedFileDescriptor endpoint;
  static constexpr auto arguments() { return std::tuple{Argument{"endpoint", &SetEndpoint::endpoint}}; }
};

}  // namespace broadcastcall

/// How a broadcast's samples leave the daemon: as short movies, or one by one over the link.
enum class BroadcastProcessMode : int64_t { MovieClips = 0, Samples = 1 };

/// Lifecycle actions.
enum class BroadcastAction : int64_t { Started = 1, Paused = 2, Resumed = 3, Finished = 4 };

/// Keys of the payloads of "processPayload". A payload has exactly the keys of its kind: an action (kActionType,
/// kUserInfo), a video sample (kVideoOrientation, kSampleType, kSharedFrame, kTimingInfo, kPauses), a run of audio
/// (kSampleType, kAudioBufferList, kAudioFormatDescription, kTimingInfo, kNumSamples, kPauses), the application in
/// front (kFrontmostApp).
namespace broadcastpayload {
inline constexpr const char kActionType[] = "QVBroadcastProcessExtensionPayloadKeyActionType";
inline constexpr const char kUserInfo[] = "QVBroadcastExtensionKeyExtensionUserInfo";
inline constexpr const char kSampleType[] = "QVBroadcastProcessExtensionPayloadKeySampleType";
inline constexpr const char kVideoOrientation[] = "QVSampleBufferVideoOrientation";
inline constexpr const char kSharedFrame[] = "QVBroadcastProcessExtensionPayloadKeySharedFrame";
/// The raw 72-byte SampleTimingInfo.
inline constexpr const char kTimingInfo[] = "QVBroadcastProcessExtensionPayloadKeyTimingInfo";
/// The raw 24-byte MediaTime: the sum of the pauses before the sample. It is taken out of a picture's timing already,
/// and still in that of sound.
inline constexpr const char kPauses[] = "QVBroadcastProcessExtensionPayloadKeyPauses";
inline constexpr const char kAudioBufferList[] = "QVBroadcastProcessExtensionPayloadKeyAudioBufferList";
/// The raw 40-byte AudioStreamDescription.
inline constexpr const char kAudioFormatDescription[] = "QVBroadcastProcessExtensionPayloadKeyAudioFormatDescription";
inline constexpr const char kNumSamples[] = "QVBroadcastProcessExtensionPayloadKeyNumSamples";
inline constexpr const char kFrontmostApp[] = "QVBroadcastProcessExtensionPayloadKeyFrontmostAppBundleID";
}  // namespace broadcastpayload

/// Titles of the items of a clip's request, to the extension and back.
namespace broadcastitem {
inline constexpr const char kRequestedFinish[] = "QVBroadcastExtensionKeyRequestedFinish";  ///< "1" or "0"
inline constexpr const char kSandboxToken[] = "QVBroadcastExtensionKeyExtensionSandboxToken";
inline constexpr const char kUserInfo[] = "QVBroadcastExtensionKeyExtensionUserInfo";
inline constexpr const char kMovieClipURL[] = "QVBroadcastExtensionKeyMovieClipURL";
inline constexpr const char kBroadcastConfiguration[] = "QVBroadcastExtensionKeyBroadcastConfiguration";
inline constexpr const char kServiceInfo[] = "QVBroadcastExtensionKeyExtensionServiceInfo";
}  // namespace broadcastitem

/// The extension points, the attribute of the process mode and its one known value.
namespace broadcastpoint {
inline constexpr const char kUpload[] = "com.tarnwick.broadcast-services-upload";
inline constexpr const char kGeneral[] = "com.tarnwick.broadcast-services";
inline constexpr const char kProcessMode[] = "QVBroadcastProcessMode";
inline constexpr const char kProcessModeSampleBuffer[] = "QVBroadcastProcessModeSampleBuffer";
}  // namespace broadcastpoint

}  // namespace qv
