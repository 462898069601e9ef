#pragma once

#include "protocol/Calls.h"

namespace qv {

/// The named service of the daemon.
inline constexpr const char kServiceName[] = "com.tarnwick.quorveld";

/// What clients call on the daemon. What each does is in docs/protocol.md.
const platform::IPCInterface& daemonProtocol();

namespace request {

struct StartRecording {
  static constexpr const char kMember[] = "startRecordingWindowLayerContextIDs";
  static constexpr const char kReply[] = "a{sv} error, b microphoneEnabled, b cameraEnabled";
  std::vector<uint32_t> contextIDs;
  platform::Size windowSize;  ///< pixels
  bool microphoneEnabled = false, cameraEnabled = false, broadcast = false, systemRecording = false;
  bool captureEnabled = false;
  platform::ListenerEndpoint listenerEndpoint;
  static constexpr auto arguments() {
    using Call = StartRecording;
    return std::tuple{Argument{"contextIDs", &Call::contextIDs},
                      Argument{"windowSize", &Call::windowSize},
                      Argument{"microphoneEnabled", &Call::microphoneEnabled},
                      Argument{"cameraEnabled", &Call::cameraEnabled},
                      Argument{"broadcast", &Call::broadcast},
                      Argument{"systemRecording", &Call::systemRecording},
                      Argument{"captureEnabled", &Call::captureEnabled},
                      Argument{"listenerEndpoint", &Call::listenerEndpoint}};
  }
};

struct SetupBroadcast {
  static constexpr const char kMember[] = "setupBroadcastWithHostBundleID";
  static constexpr const char kReply[] = "a{sv} error";
  std::string hostBundleID, broadcastExtensionBundleID;
  platform::Data broadcastConfigurationData;  ///< an archived QVBroadcastConfiguration
  platform::Dictionary userInfo;
  static constexpr auto arguments() {
    using Call = SetupBroadcast;
    return std::tuple{Argument{"hostBundleID", &Call::hostBundleID},
                      Argument{"broadcastExtensionBundleID", &Call::broadcastExtensionBundleID},
                      Argument{"broadcastConfigurationData", &Call::broadcastConfigurationData},
                      Argument{"userInfo", &Call::userInfo}};
  }
};

struct GetBroadcastImages : NoArguments {
  static constexpr const char kMember[] = "getCurrentBroadcastImages";
  static constexpr const char kReply[] = "ay hostAppImage, ay extensionImage";
};

struct GetBroadcastExtensions : NoArguments {
  static constexpr const char kMember[] = "getSystemBroadcastExtensionInfo";
  static constexpr const char kReply[] = "aa{sv} extensions, a{sv} error";
};

struct Stop : NoArguments {
  static constexpr const char kMember[] = "stopRecordingWithHandler";
  static constexpr const char kReply[] = "s movieURL, a{sv} error";
};

struct StopTrimmed {
  static constexpr const char kMember[] = "stopRecordingWithStartClipDuration";
  static constexpr const char kReply[] = "s movieURL, a{sv} error";
  double startClipDuration = 0, endClipDuration = 0;  ///< seconds
  static constexpr auto arguments() {
    return std::tuple{Argument{"startClipDuration", &StopTrimmed::startClipDuration},
                      Argument{"endClipDuration", &StopTrimmed::endClipDuration}};
  }
};

struct SaveVideo {
  static constexpr const char kMember[] = "saveVideoToCameraRoll";
  static constexpr const char kReply[] = "a{sv} error";
  platform::URL movieURL;
  static constexpr auto arguments() { return std::tuple{Argument{"movieURL", &SaveVideo::movieURL}}; }
};

struct OpenMovie {
  static constexpr const char kMember[] = "openMovieAtURL";
  static constexpr const char kReply[] = "ah movie, a{sv} error";
  platform::URL movieURL;
  static constexpr auto arguments() { return std::tuple{Argument{"movieURL", &OpenMovie::movieURL}}; }
};

struct Pause : NoArguments {
  static constexpr const char kMember[] = "pauseRecording";
};

struct Resume {
  static constexpr const char kMember[] = "resumeRecordingWithWindowLayerContextID";
  uint32_t contextID = 0;
  static constexpr auto arguments() { return std::tuple{Argument{"contextID", &Resume::contextID}}; }
};

struct SetMicrophoneEnabled {
  static constexpr const char kMember[] = "setMicrophoneEnabled";
  bool enabled = false;
  static constexpr auto arguments() { return std::tuple{Argument{"enabled", &SetMicrophoneEnabled::enabled}}; }
};

struct UpdateProcessID {
  static constexpr const char kMember[] = "updateProcessIDForAudioCaptureWithPID";
  int32_t processID = 0;
  static constexpr auto arguments() { return std::tuple{Argument{"processID", &UpdateProcessID::processID}}; }
};

struct Discard : NoArguments {
  static constexpr const char kMember[] = "discardRecordingWithHandler";
  static constexpr const char kReply[] = "";
};

struct DidBecomeActive : NoArguments {
  static constexpr const char kMember[] = "clientDidBecomeActive";
};

struct DidResignActive : NoArguments {
  static constexpr const char kMember[] = "clientDidResignActive";
};

struct GetState : NoArguments {
  static constexpr const char kMember[] = "synchronousGetCurrentState";
  static constexpr const char kReply[] = "a{sv} state";
};

struct SetCameraConsent {
  static constexpr const char kMember[] = "setHasUserConsentForCamera";
  bool consent = false;
  static constexpr auto arguments() { return std::tuple{Argument{"consent", &SetCameraConsent::consent}}; }
};

struct SetMicrophoneConsent {
  static constexpr const char kMember[] = "setHasUserConsentForMicrophone";
  bool consent = false;
  static constexpr auto arguments() { return std::tuple{Argument{"consent", &SetMicrophoneConsent::consent}}; }
};

struct SetBroadcastURL {
  static constexpr const char kMember[] = "setBroadcastURL";
  std::string broadcastURL;
  static constexpr auto arguments() { return std::tuple{Argument{"broadcastURL", &SetBroadcastURL::broadcastURL}}; }
};

struct SetMicrophoneEnabledPersistent {
  static constexpr const char kMember[] = "setMicrophoneEnabledPersistent";
  bool enabled = false;
  static constexpr auto arguments() {
    return std::tuple{Argument{"enabled", &SetMicrophoneEnabledPersistent::enabled}};
  }
};

struct ReportCameraUsage {
  static constexpr const char kMember[] = "reportCameraUsage";
  int32_t cameraPosition = 0;
  static constexpr auto arguments() {
    return std::tuple{Argument{"cameraPosition", &ReportCameraUsage::cameraPosition}};
  }
};

using All = CallList<StartRecording, SetupBroadcast, GetBroadcastImages, GetBroadcastExtensions, Stop, StopTrimmed,
                     SaveVideo, OpenMovie, Pause, Resume, SetMicrophoneEnabled, UpdateProcessID, Discard,
                     DidBecomeActive, DidResignActive, GetState, SetCameraConsent, SetMicrophoneConsent,
                     SetBroadcastURL, SetMicrophoneEnabledPersistent, ReportCameraUsage>;

}  // namespace request
}  // namespace qv
