#include "daemon/Requests.h"

#include <algorithm>

namespace qv {

using platform::Value;

const Value& NamedArguments::operator[](std::string_view name) const {
  static const Value none;
  const auto& names = operation_.argumentNames;
  const auto found = std::find(names.begin(), names.end(), name);
  const auto at = static_cast<size_t>(found - names.begin());
  return at < arguments_.size() ? arguments_[at] : none;
}

namespace request {
namespace {

std::vector<uint32_t> contextIDsFrom(const Value& value) {
  std::vector<uint32_t> contextIDs;
  for (const Value& contextID : value.asArray()) contextIDs.push_back(static_cast<uint32_t>(contextID.asInteger()));
  return contextIDs;
}

platform::Size sizeFrom(const Value& value) {
  const auto& sides = value.asArray();
  return sides.size() == 2 ? platform::Size{sides[0].asDouble(), sides[1].asDouble()} : platform::Size{};
}

platform::ListenerEndpoint endpointFrom(const Value& handles) {
  for (const Value& handle : handles.asArray()) {
    if (const auto* descriptor = handle.getIf<platform::SharedFileDescriptor>()) {
      return platform::ListenerEndpoint(*descriptor);
    }
  }
  return {};
}

}  // namespace

StartRecording::StartRecording(const NamedArguments& arguments)
    : contextIDs(contextIDsFrom(arguments["contextIDs"])),
      windowSize(sizeFrom(arguments["windowSize"])),
      microphoneEnabled(arguments["microphoneEnabled"].asBool()),
      cameraEnabled(arguments["cameraEnabled"].asBool()),
      broadcast(arguments["broadcast"].asBool()),
      systemRecording(arguments["systemRecording"].asBool()),
      captureEnabled(arguments["captureEnabled"].asBool()),
      listenerEndpoint(endpointFrom(arguments["listenerEndpoint"])) {}

SetupBroadcast::SetupBroadcast(const NamedArguments& arguments)
    : hostBundleID(arguments["hostBundleID"].asString()),
      broadcastExtensionBundleID(arguments["broadcastExtensionBundleID"].asString()),
      broadcastConfigurationData(arguments["broadcastConfigurationData"].asData()),
      userInfo(arguments["userInfo"].asDictionary()) {}

StopTrimmed::StopTrimmed(const NamedArguments& arguments)
    : startClipDuration(arguments["startClipDuration"].asDouble()),
      endClipDuration(arguments["endClipDuration"].asDouble()) {}

SaveVideo::SaveVideo(const NamedArguments& arguments) : movieURL(arguments["movieURL"].asString()) {}

Resume::Resume(const NamedArguments& arguments)
    : contextID(static_cast<uint32_t>(arguments["contextID"].asInteger())) {}

UpdateProcessID::UpdateProcessID(const NamedArguments& arguments)
    : processID(static_cast<int32_t>(arguments["processID"].asInteger())) {}

SetBroadcastURL::SetBroadcastURL(const NamedArguments& arguments)
    : broadcastURL(arguments["broadcastURL"].asString()) {}

ReportCameraUsage::ReportCameraUsage(const NamedArguments& arguments)
    : cameraPosition(static_cast<int32_t>(arguments["cameraPosition"].asInteger())) {}

Enable::Enable(const NamedArguments& arguments) : enabled(arguments["enabled"].asBool()) {}

Consent::Consent(const NamedArguments& arguments) : consent(arguments["consent"].asBool()) {}

}  // namespace request
}  // namespace qv
