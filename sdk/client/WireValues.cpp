#include "sdk/client/WireValues.h"

#include <fcntl.h>

#include "sdk/client/RecordingErrors.h"
#include "sdk/common/SampleCoding.h"

namespace qv::client {

using platform::Array;
using platform::IPCArguments;

std::optional<IPCArguments> startArguments(const quorvel::StartOptions& options) {
  Array contextIDs, endpoint;
  for (const uint32_t window : options.windows) contextIDs.emplace_back(window);
  if (options.listenerEndpoint >= 0) {
    platform::FileDescriptor copy(::fcntl(options.listenerEndpoint, F_DUPFD_CLOEXEC, 0));
    if (!copy.isValid()) return std::nullopt;
    endpoint.emplace_back(platform::shareFileDescriptor(std::move(copy)));
  }
  return IPCArguments{contextIDs,         Array{options.width, options.height},
                      options.microphone, options.camera,
                      options.broadcast,  options.system,
                      options.capture,    endpoint};
}

std::optional<quorvel::Error> errorFromWire(const platform::Value& value) {
  const platform::Dictionary& dictionary = value.asDictionary();
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

std::optional<quorvel::VideoFrame> videoFrameFromWire(const IPCArguments& arguments) {
  if (arguments.size() != 2) return std::nullopt;
  return sdk::videoFrameFromWire(arguments[0], arguments[1].asData());
}

std::optional<quorvel::AudioSample> audioSampleFromWire(const IPCArguments& arguments) {
  if (arguments.size() != 5) return std::nullopt;
  return sdk::audioSampleFromWire({.bytes = arguments[0].asData(),
                                   .format = arguments[1].asData(),
                                   .numSamples = arguments[2].asInteger(-1),
                                   .sampleType = arguments[3].asInteger(),
                                   .timing = arguments[4].asData()});
}

}  // namespace qv::client
