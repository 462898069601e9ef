#include "protocol/QVClientProtocol.h"

namespace qv {

const platform::IPCInterface& clientProtocol() {
  static const platform::IPCInterface interface {
    "com.tarnwick.quorveld.QVClientProtocol", {
      {"updateScreenRecordingState", {"b"}, {"recording"}, std::nullopt, {}},
          {"stopRecordingWithError", {"a{sv}", "s"}, {"error", "movieURL"}, std::nullopt, {}},
          {"updateBroadcastServiceInfo", {"a{sv}"}, {"serviceInfo"}, std::nullopt, {}},
          {"updateBroadcastURL", {"s"}, {"broadcastURL"}, std::nullopt, {}},
          {"captureHandlerWithSample", {"(hhuuuu)", "ay"}, {"sample", "timingData"}, std::nullopt, {}, true},
          {"captureHandlerWithAudioSample",
           {"ay", "ay", "x", "x", "ay"},
           {"sample", "absdData", "itemCount", "bufferType", "timingData"},
           std::nullopt,
           {},
           true},
          {"captureTimelineDidChange", {"ay"}, {"pauses"}, std::nullopt, {}},
          {"recordingLockInterrupted", {"a{sv}"}, {"error"}, std::nullopt, {}},
          {"recordingTimerDidUpdate", {"s"}, {"time"}, std::nullopt, {}},
    }
  };
  return interface;
}

}  // namespace qv
