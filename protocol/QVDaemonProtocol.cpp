#include "protocol/QVDaemonProtocol.h"

namespace qv {

const platform::IPCInterface& daemonProtocol() {
  using Reply = std::vector<std::string>;
  static const platform::IPCInterface interface {
    "com.tarnwick.quorveld.QVDaemonProtocol", {
      {"startRecordingWindowLayerContextIDs",
       {"au", "(dd)", "b", "b", "b", "b", "b", "ah"},
       {"contextIDs", "windowSize", "microphoneEnabled", "cameraEnabled", "broadcast", "systemRecording",
        "captureEnabled", "listenerEndpoint"},
       Reply{"a{sv}", "b", "b"},
       {"error", "microphoneEnabled", "cameraEnabled"}},
          {"setupBroadcastWithHostBundleID",
           {"s", "s", "ay", "a{sv}"},
           {"hostBundleID", "broadcastExtensionBundleID", "broadcastConfigurationData", "userInfo"},
           Reply{"a{sv}"},
           {"error"}},
          {"getCurrentBroadcastImages", {}, {}, Reply{"ay", "ay"}, {"hostAppImage", "extensionImage"}},
          {"getSystemBroadcastExtensionInfo", {}, {}, Reply{"aa{sv}", "a{sv}"}, {"extensions", "error"}},
          {"stopRecordingWithHandler", {}, {}, Reply{"s", "a{sv}"}, {"movieURL", "error"}},
          {"stopRecordingWithStartClipDuration",
           {"d", "d"},
           {"startClipDuration", "endClipDuration"},
           Reply{"s", "a{sv}"},
           {"movieURL", "error"}},
          {"saveVideoToCameraRoll", {"s"}, {"movieURL"}, Reply{"a{sv}"}, {"error"}},
          {"pauseRecording", {}, {}, std::nullopt, {}},
          {"resumeRecordingWithWindowLayerContextID", {"u"}, {"contextID"}, std::nullopt, {}},
          {"setMicrophoneEnabled", {"b"}, {"enabled"}, std::nullopt, {}},
          {"updateProcessIDForAudioCaptureWithPID", {"i"}, {"processID"}, std::nullopt, {}},
          {"discardRecordingWithHandler", {}, {}, Reply{}, {}}, {"clientDidBecomeActive", {}, {}, std::nullopt, {}},
          {"clientDidResignActive", {}, {}, std::nullopt, {}},
          {"synchronousGetCurrentState", {}, {}, Reply{"a{sv}"}, {"state"}},
          {"setHasUserConsentForCamera", {"b"}, {"consent"}, std::nullopt, {}},
          {"setHasUserConsentForMicrophone", {"b"}, {"consent"}, std::nullopt, {}},
          {"setBroadcastURL", {"s"}, {"broadcastURL"}, std::nullopt, {}},
          {"setMicrophoneEnabledPersistent", {"b"}, {"enabled"}, std::nullopt, {}},
          {"reportCameraUsage", {"i"}, {"cameraPosition"}, std::nullopt, {}},
    }
  };
  return interface;
}

}  // namespace qv
