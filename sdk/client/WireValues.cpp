#include "sdk/client/WireValues.h"

#include <fcntl.h>

#include "sdk/client/RecorderErrors.h"

namespace qv::client {

std::optional<request::StartRecording> startRequest(const quorvel::StartOptions& options) {
  platform::ListenerEndpoint endpoint;
  if (options.listenerEndpoint >= 0) {
    platform::FileDescriptor copy(::fcntl(options.listenerEndpoint, F_DUPFD_CLOEXEC, 0));
    if (!copy.isValid()) return std::nullopt;
    endpoint = platform::ListenerEndpoint(platform::shareFileDescriptor(std::move(copy)));
  }
  return request::StartRecording{.contextIDs = options.windows,
                                 .windowSize = {options.width, options.height},
                                 .microphoneEnabled = options.microphone,
                                 .cameraEnabled = options.camera,
                                 .broadcast = options.broadcast,
                                 .systemRecording = options.system,
                                 .captureEnabled = options.capture,
                                 .listenerEndpoint = std::move(endpoint)};
}

std::optional<quorvel::Error> errorFromWire(const platform::Dictionary& dictionary) {
  if (dictionary.empty()) return std::nullopt;
  const platform::Value code = valueForKey(dictionary, "code");
  if (!code.isNumber()) return libraryError(quorvel::kErrorUnknown, "malformed error");
  return errorFromDaemon(*platform::decodeError(dictionary));
}

quorvel::State stateFromWire(const platform::Dictionary& dictionary) {
  const auto flag = [&](const char* key) { return valueForKey(dictionary, key).asBool(); };
  quorvel::State state;
  state.recording = flag("isRecording");
  state.broadcasting = flag("isBroadcasting");
  state.microphoneEnabled = flag("microphoneEnabled");
  state.systemRecording = flag("isSystemRecording");
  state.userConsentForMicrophone = flag("hasUserConsentForMicrophone");
  state.userConsentForCamera = flag("hasUserConsentForCamera");
  state.microphoneEnabledPersistent = flag("microphoneEnabledPersistent");
  const platform::Value url = valueForKey(dictionary, "broadcastURL");
  if (const auto* text = url.getIf<std::string>()) state.broadcastURL = *text;
  if (const auto* location = url.getIf<platform::URL>()) state.broadcastURL = location->absoluteString();
  return state;
}

quorvel::BroadcastExtension extensionFromWire(const platform::Dictionary& dictionary) {
  return {valueForKey(dictionary, "displayName").asString(), valueForKey(dictionary, "extBundleID").asString(),
          valueForKey(dictionary, "extAppImgData").asData()};
}

}  // namespace qv::client
