#include "sdk/c/CError.h"
#include "sdk/c/CRecorder.h"
#include "sdk/c/CSamples.h"
#include "sdk/c/CValue.h"

namespace qv::c {

quorvel::Recorder::FailureHandler failureHandler(quorvel_error_handler handler, void* context) {
  if (!handler) return {};
  return [=](quorvel::Error error) { handler(context, errorFor(std::move(error)).get()); };
}

quorvel::Recorder::CompletionHandler completionHandler(quorvel_error_handler handler, void* context) {
  if (!handler) return {};
  return [=](const std::optional<quorvel::Error>& error) { handler(context, errorFor(error).get()); };
}

namespace {

void addBroadcastEvents(quorvel::Events& events, const quorvel_events& from) {
  if (from.broadcast_service_info_changed) {
    events.broadcastServiceInfoChanged = [from](const quorvel::Dictionary& info) {
      from.broadcast_service_info_changed(from.context, valueFor(info).get());
    };
  }
  if (from.broadcast_url_changed)
    events.broadcastURLChanged = [from](const std::string& url) {
      from.broadcast_url_changed(from.context, url.c_str());
    };
}

/// The samples are counted from here on: the program may keep them.
void addSamples(quorvel::Events& events, const quorvel_events& from) {
  if (from.video_frame) {
    events.videoFrame = [from](quorvel::VideoFrame frame) {
      from.video_frame(from.context, Reference<CVideoFrame>(new CVideoFrame(std::move(frame))).get());
    };
  }
  if (from.audio_sample) {
    events.audioSample = [from](quorvel::AudioSample sample) {
      from.audio_sample(from.context, Reference<CAudioSample>(new CAudioSample(std::move(sample))).get());
    };
  }
}

void addSystemEvents(quorvel::Events& events, const quorvel_events& from) {
  if (from.recording_state_changed)
    events.recordingStateChanged = [from](bool recording) { from.recording_state_changed(from.context, recording); };
  if (from.recording_timer_changed)
    events.recordingTimerChanged = [from](const std::string& time) {
      from.recording_timer_changed(from.context, time.c_str());
    };
  events.recordingLockInterrupted = failureHandler(from.recording_lock_interrupted, from.context);
}

}  // namespace

quorvel::Events eventsFor(const quorvel_events& from) {
  quorvel::Events events;
  if (from.stopped) {
    events.stopped = [from](const quorvel::StopResult& result) {
      from.stopped(from.context, errorFor(result.error).get(), result.movieURL.c_str());
    };
  }
  if (from.interrupted) events.interrupted = [from] { from.interrupted(from.context); };
  if (from.connected) events.connected = [from] { from.connected(from.context); };
  addBroadcastEvents(events, from);
  addSamples(events, from);
  addSystemEvents(events, from);
  return events;
}

}  // namespace qv::c
