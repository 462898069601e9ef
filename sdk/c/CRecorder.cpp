#include "sdk/c/CRecorder.h"

#include <fcntl.h>

#include <cerrno>
#include <cstdio>
#include <system_error>
#include <utility>

#include "sdk/c/CError.h"
#include "sdk/c/WorkQueue.h"

using namespace qv::c;

namespace {

std::function<void(quorvel::StopResult)> stopHandler(quorvel_stop_handler handler, void* context) {
  if (!handler) return {};
  return [=](const quorvel::StopResult& result) {
    handler(context, errorFor(result.error).get(), result.movieURL.c_str());
  };
}

/// The program's own descriptor of a movie.
void handOver(quorvel_open_movie_handler handler, void* context, const quorvel::OpenMovieResult& result) {
  if (result.error) return handler(context, errorFor(result.error).get(), -1);
  const int file = ::fcntl(result.file, F_DUPFD_CLOEXEC, 0);
  if (file >= 0) return handler(context, nullptr, file);
  const int failure = errno;
  quorvel::Error error{failure, std::string(quorvel::errorKey(quorvel::kErrorUnknown)),
                       std::generic_category().message(failure), "posix"};
  handler(context, errorFor(std::move(error)).get(), -1);
}

quorvel_state stateFor(const quorvel::State& state) {
  return {.recording = state.recording,
          .broadcasting = state.broadcasting,
          .microphone_enabled = state.microphoneEnabled,
          .system_recording = state.systemRecording,
          .user_consent_for_microphone = state.userConsentForMicrophone,
          .user_consent_for_camera = state.userConsentForCamera,
          .microphone_enabled_persistent = state.microphoneEnabledPersistent,
          .broadcast_url = state.broadcastURL ? state.broadcastURL->c_str() : nullptr};
}

quorvel::StartOptions startOptions(const quorvel_start_options& from) {
  quorvel::StartOptions options;
  options.windows.assign(from.windows, from.windows + (from.windows ? from.window_count : 0));
  options.width = from.width;
  options.height = from.height;
  options.microphone = from.microphone;
  options.camera = from.camera;
  options.broadcast = from.broadcast;
  options.system = from.system;
  options.capture = from.capture;
  options.listenerEndpoint = from.listener_endpoint;
  return options;
}

}  // namespace

quorvel_recorder* quorvel_recorder_create(const quorvel_recorder_options* options) {
  const auto given = read(options, quorvel_recorder_options QUORVEL_RECORDER_OPTIONS_INIT);
  quorvel::RecorderOptions made;
  made.events = eventsFor(given.events);
  if (given.queue) {
    made.executor = [queue = given.queue->work](std::function<void()> work) { queue->post(std::move(work)); };
  }
  return new quorvel_recorder{quorvel::Recorder::create(std::move(made))};
}

void quorvel_recorder_destroy(quorvel_recorder* recorder) { delete recorder; }

void quorvel_recorder_start(quorvel_recorder* recorder, const quorvel_start_options* options,
                            quorvel_start_handler handler, void* context) {
  std::function<void(quorvel::StartResult)> answer;
  if (handler) {
    answer = [=](const quorvel::StartResult& result) {
      handler(context, errorFor(result.error).get(), result.microphone, result.camera);
    };
  }
  recorder->recorder->start(startOptions(read(options, quorvel_start_options QUORVEL_START_OPTIONS_INIT)),
                            std::move(answer));
}

void quorvel_recorder_stop(quorvel_recorder* recorder, quorvel_stop_handler handler, void* context) {
  recorder->recorder->stop(stopHandler(handler, context));
}

void quorvel_recorder_stop_trimmed(quorvel_recorder* recorder, double start_seconds, double end_seconds,
                                   quorvel_stop_handler handler, void* context) {
  const quorvel::StopOptions options{std::chrono::duration<double>(start_seconds),
                                     std::chrono::duration<double>(end_seconds)};
  recorder->recorder->stop(options, stopHandler(handler, context));
}

void quorvel_recorder_pause(quorvel_recorder* recorder, quorvel_error_handler on_failure, void* context) {
  recorder->recorder->pause(failureHandler(on_failure, context));
}

void quorvel_recorder_resume(quorvel_recorder* recorder, uint32_t window, quorvel_error_handler on_failure,
                             void* context) {
  recorder->recorder->resume(window, failureHandler(on_failure, context));
}

void quorvel_recorder_set_microphone_enabled(quorvel_recorder* recorder, bool enabled, quorvel_error_handler on_failure,
                                             void* context) {
  recorder->recorder->setMicrophoneEnabled(enabled, failureHandler(on_failure, context));
}

void quorvel_recorder_update_process_id_for_audio_capture(quorvel_recorder* recorder, pid_t pid,
                                                          quorvel_error_handler on_failure, void* context) {
  recorder->recorder->updateProcessIDForAudioCapture(pid, failureHandler(on_failure, context));
}

void quorvel_recorder_discard(quorvel_recorder* recorder, quorvel_error_handler handler, void* context) {
  recorder->recorder->discard(completionHandler(handler, context));
}

void quorvel_recorder_save_video_to_camera_roll(quorvel_recorder* recorder, const char* movie_url,
                                                quorvel_error_handler handler, void* context) {
  recorder->recorder->saveVideoToCameraRoll(text(movie_url), completionHandler(handler, context));
}

void quorvel_recorder_open_movie(quorvel_recorder* recorder, const char* movie_url, quorvel_open_movie_handler handler,
                                 void* context) {
  recorder->recorder->openMovie(text(movie_url), [=](const quorvel::OpenMovieResult& result) {
    if (handler) handOver(handler, context, result);
  });
}

void quorvel_recorder_current_state(quorvel_recorder* recorder, quorvel_state_handler handler, void* context) {
  recorder->recorder->currentState([=](const quorvel::StateResult& result) {
    const quorvel_state state = stateFor(result.state);
    if (handler) handler(context, errorFor(result.error).get(), result.error ? nullptr : &state);
  });
}

void quorvel_recorder_did_become_active(quorvel_recorder* recorder, quorvel_error_handler on_failure, void* context) {
  recorder->recorder->didBecomeActive(failureHandler(on_failure, context));
}

void quorvel_recorder_did_resign_active(quorvel_recorder* recorder, quorvel_error_handler on_failure, void* context) {
  recorder->recorder->didResignActive(failureHandler(on_failure, context));
}

void quorvel_recorder_keep_connected(quorvel_recorder* recorder, bool keep) { recorder->recorder->keepConnected(keep); }

void quorvel_recorder_set_has_user_consent_for_camera(quorvel_recorder* recorder, bool consent,
                                                      quorvel_error_handler on_failure, void* context) {
  recorder->recorder->setHasUserConsentForCamera(consent, failureHandler(on_failure, context));
}

void quorvel_recorder_set_has_user_consent_for_microphone(quorvel_recorder* recorder, bool consent,
                                                          quorvel_error_handler on_failure, void* context) {
  recorder->recorder->setHasUserConsentForMicrophone(consent, failureHandler(on_failure, context));
}

void quorvel_recorder_set_microphone_enabled_persistent(quorvel_recorder* recorder, bool enabled,
                                                        quorvel_error_handler on_failure, void* context) {
  recorder->recorder->setMicrophoneEnabledPersistent(enabled, failureHandler(on_failure, context));
}

void quorvel_recorder_report_camera_usage(quorvel_recorder* recorder, int32_t camera_position,
                                          quorvel_error_handler on_failure, void* context) {
  recorder->recorder->reportCameraUsage(camera_position, failureHandler(on_failure, context));
}

uint64_t quorvel_recorder_get_dropped_samples(const quorvel_recorder* recorder) {
  return recorder->recorder->droppedSamples();
}

size_t quorvel_file_path(const char* url, char* buffer, size_t size) {
  const std::string path = quorvel::filePath(text(url));
  return static_cast<size_t>(std::snprintf(buffer, size, "%s", path.c_str()));
}
