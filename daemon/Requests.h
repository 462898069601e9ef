#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "platform/IPC.h"
#include "platform/base/Geometry.h"

namespace qv {

/// The arguments of one call, by the names that the interface gives them.
///
/// Threading: a view; it must not outlive the call.
class NamedArguments {
 public:
  NamedArguments(const platform::IPCOperation& operation, const platform::IPCArguments& arguments)
      : operation_(operation), arguments_(arguments) {}
  /// None where the operation has no such argument.
  [[nodiscard]] const platform::Value& operator[](std::string_view name) const;

 private:
  const platform::IPCOperation& operation_;
  const platform::IPCArguments& arguments_;
};

/// What clients ask of the daemon, one type for each operation that has arguments. Each is read from the arguments
/// once, by their names; the member that it belongs to is the interface's.
namespace request {

struct StartRecording {
  explicit StartRecording(const NamedArguments& arguments);
  std::vector<uint32_t> contextIDs;
  platform::Size windowSize;
  bool microphoneEnabled, cameraEnabled, broadcast, systemRecording, captureEnabled;
  platform::ListenerEndpoint listenerEndpoint;
};
struct SetupBroadcast {
  explicit SetupBroadcast(const NamedArguments& arguments);
  std::string hostBundleID, broadcastExtensionBundleID;
  platform::Data broadcastConfigurationData;
  platform::Dictionary userInfo;
};
struct StopTrimmed {
  explicit StopTrimmed(const NamedArguments& arguments);
  double startClipDuration, endClipDuration;  ///< seconds
};
struct SaveVideo {
  explicit SaveVideo(const NamedArguments& arguments);
  platform::URL movieURL;
};
struct Resume {
  explicit Resume(const NamedArguments& arguments);
  uint32_t contextID;
};
struct UpdateProcessID {
  explicit UpdateProcessID(const NamedArguments& arguments);
  int32_t processID;
};
struct SetBroadcastURL {
  explicit SetBroadcastURL(const NamedArguments& arguments);
  std::string broadcastURL;
};
struct ReportCameraUsage {
  explicit ReportCameraUsage(const NamedArguments& arguments);
  int32_t cameraPosition;
};
/// `setMicrophoneEnabled` and `setMicrophoneEnabledPersistent`.
struct Enable {
  explicit Enable(const NamedArguments& arguments);
  bool enabled;
};
/// `setHasUserConsentForCamera` and `setHasUserConsentForMicrophone`.
struct Consent {
  explicit Consent(const NamedArguments& arguments);
  bool consent;
};
/// An operation without arguments.
struct Plain {
  explicit Plain(const NamedArguments&) {}
};

}  // namespace request
}  // namespace qv
