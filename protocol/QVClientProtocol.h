#pragma once

#include "protocol/Calls.h"

namespace qv {

/// What the daemon calls on a client. All operations are one-way.
const platform::IPCInterface& clientProtocol();

namespace callback {

struct UpdateScreenRecordingState {
  static constexpr const char kMember[] = "updateScreenRecordingState";
  bool recording = false;
  static constexpr auto arguments() {
    return std::tuple{Argument{"recording", &UpdateScreenRecordingState::recording}};
  }
};

struct StopRecordingWithError {
  static constexpr const char kMember[] = "stopRecordingWithError";
  platform::Dictionary error;  ///< encoded; empty for none
  platform::URL movieURL;      ///< empty for none
  static constexpr auto arguments() {
    return std::tuple{Argument{"error", &StopRecordingWithError::error},
                      Argument{"movieURL", &StopRecordingWithError::movieURL}};
  }
};

struct UpdateBroadcastServiceInfo {
  static constexpr const char kMember[] = "updateBroadcastServiceInfo";
  platform::Dictionary serviceInfo;
  static constexpr auto arguments() {
    return std::tuple{Argument{"serviceInfo", &UpdateBroadcastServiceInfo::serviceInfo}};
  }
};

struct UpdateBroadcastURL {
  static constexpr const char kMember[] = "updateBroadcastURL";
  platform::URL broadcastURL;
  static constexpr auto arguments() { return std::tuple{Argument{"broadcastURL", &UpdateBroadcastURL::broadcastURL}}; }
};

/// Both kinds of samples are made and read by SampleCoding.h.
struct CaptureHandlerWithSample {
  static constexpr const char kMember[] = "captureHandlerWithSample";
  static constexpr bool kIsMedia = true;
  QVSharedFrameObject sample;
  platform::Data timingData;  ///< one raw SampleTimingInfo, 72 bytes
  static constexpr auto arguments() {
    return std::tuple{Argument{"sample", &CaptureHandlerWithSample::sample},
                      Argument{"timingData", &CaptureHandlerWithSample::timingData}};
  }
};

struct CaptureHandlerWithAudioSample {
  static constexpr const char kMember[] = "captureHandlerWithAudioSample";
  static constexpr bool kIsMedia = true;
  platform::Data sample;
  platform::Data absdData;  ///< one raw AudioStreamDescription, 40 bytes
  int64_t itemCount = 0;    ///< frames
  int64_t bufferType = 0;   ///< a SampleType
  platform::Data timingData;
  static constexpr auto arguments() {
    using Call = CaptureHandlerWithAudioSample;
    return std::tuple{Argument{"sample", &Call::sample}, Argument{"absdData", &Call::absdData},
                      Argument{"itemCount", &Call::itemCount}, Argument{"bufferType", &Call::bufferType},
                      Argument{"timingData", &Call::timingData}};
  }
};

/// To be sent from the thread that sends the samples, before the first of each capture and before the first with
/// another sum: it is never dropped, and messages keep their order.
struct CaptureTimelineDidChange {
  static constexpr const char kMember[] = "captureTimelineDidChange";
  platform::Data pauses;  ///< one raw MediaTime, 24 bytes: the sum of the pauses before the samples that follow
  static constexpr auto arguments() { return std::tuple{Argument{"pauses", &CaptureTimelineDidChange::pauses}}; }
};

struct RecordingLockInterrupted {
  static constexpr const char kMember[] = "recordingLockInterrupted";
  platform::Dictionary error;
  static constexpr auto arguments() { return std::tuple{Argument{"error", &RecordingLockInterrupted::error}}; }
};

struct RecordingTimerDidUpdate {
  static constexpr const char kMember[] = "recordingTimerDidUpdate";
  std::string time;
  static constexpr auto arguments() { return std::tuple{Argument{"time", &RecordingTimerDidUpdate::time}}; }
};

using All = CallList<UpdateScreenRecordingState, StopRecordingWithError, UpdateBroadcastServiceInfo, UpdateBroadcastURL,
                     CaptureHandlerWithSample, CaptureHandlerWithAudioSample, CaptureTimelineDidChange,
                     RecordingLockInterrupted, RecordingTimerDidUpdate>;

}  // namespace callback
}  // namespace qv
