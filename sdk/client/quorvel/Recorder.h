#pragma once

// The quorvel client library: record this application's own screen and sound.
//
//   auto recorder = quorvel::Recorder::create();
//   recorder->start({.windows = {window}, .width = 1280, .height = 720},
//                   [](quorvel::StartResult started) { ... });
//   ...
//   recorder->stop([](quorvel::StopResult stopped) { play(stopped.movieURL); });
//
// Link with `pkg-config --cflags --libs quorvel`. docs/app-developers.md is the guide.

#include <quorvel/Types.h>
#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace quorvel {

struct StartOptions {
  /// The windows (layer contexts) to record, all of this application. X11 window ids on X11.
  std::vector<uint32_t> windows = {};
  /// Size of the movie's picture in pixels.
  double width = 0, height = 0;
  bool microphone = false;  ///< ask for the microphone too
  bool camera = false;      ///< ask for the camera too
  bool broadcast = false;   ///< send to the extension of `setupBroadcast` instead of into a movie
  bool system = false;      ///< the whole screen; needs an entitlement
  bool capture = false;     ///< no movie: the samples come to `Events::videoFrame` and `audioSample`
  /// A broadcast extension's endpoint, where the application has one. Borrowed: it is duplicated.
  int listenerEndpoint = -1;
};

/// `microphone` and `camera` are what the user agreed to; they may be less than was asked.
struct StartResult {
  std::optional<Error> error;
  bool microphone = false;
  bool camera = false;
};

/// Cuts seconds off the movie's start and end, in whole seconds, where both are positive.
struct StopOptions {
  std::chrono::duration<double> startClip{0};
  std::chrono::duration<double> endClip{0};
};

/// A movie, or an error. Neither after a capture or a broadcast: there is no movie then.
struct StopResult {
  std::optional<Error> error;
  std::string movieURL;  ///< "file:///..."; empty for no movie. See filePath().
};

struct BroadcastOptions {
  std::string hostBundleID = {};
  std::string extensionBundleID = {};
  std::vector<uint8_t> configuration = {};  ///< of archivedConfiguration()
  Dictionary userInfo = {};                 ///< handed to the extension
};

/// PNG images; empty where there is none.
struct BroadcastImagesResult {
  std::optional<Error> error;
  std::vector<uint8_t> hostApp;
  std::vector<uint8_t> extension;
};

struct BroadcastExtension {
  std::string displayName;
  std::string bundleID;
  std::vector<uint8_t> icon;  ///< PNG
};
struct BroadcastExtensionsResult {
  std::optional<Error> error;
  std::vector<BroadcastExtension> extensions;
};

struct State {
  bool recording = false;
  bool broadcasting = false;
  bool microphoneEnabled = false;
  bool systemRecording = false;
  bool userConsentForMicrophone = false;
  bool userConsentForCamera = false;
  bool microphoneEnabledPersistent = false;
  std::optional<std::string> broadcastURL;
};
struct StateResult {
  std::optional<Error> error;
  State state;
};

/// What happens without having been asked for. Every entry may be empty.
struct Events {
  /// The recording ended, and neither by this application's stop nor because a later start of its own
  /// took its place: with an error, and with the movie where
  /// one was saved. A recording that was interrupted in the background may be told again, then with
  /// its movie, when the application is in front again.
  std::function<void(StopResult)> stopped = {};
  /// The daemon went away: once for each loss. Outstanding requests have ended by then, and so has the
  /// recording. The next request connects anew.
  std::function<void()> interrupted = {};
  /// A connection to the daemon was made: the first, or one after an interruption.
  std::function<void()> connected = {};
  std::function<void(bool recording)> recordingStateChanged = {};
  std::function<void(Dictionary)> broadcastServiceInfoChanged = {};
  std::function<void(std::string url)> broadcastURLChanged = {};
  /// Of a capture. The times of pictures and of sound lie on one timeline: CLOCK_MONOTONIC at their capture, less the
  /// pauses so far, to the nanosecond. A pause takes away what lies between the last picture before it and the first
  /// one after it, so the first picture after a pause has the time of the last one before. Sound that would then
  /// overlap what was given already (by half a second at the most) is cut off: the times of each source only grow.
  std::function<void(VideoFrame)> videoFrame = {};
  std::function<void(AudioSample)> audioSample = {};
  std::function<void(Error)> recordingLockInterrupted = {};
  std::function<void(std::string time)> recordingTimerChanged = {};
};

struct RecorderOptions {
  Events events = {};
  /// Where handlers and events run, one at a time and in order. Empty: on a thread of the library.
  /// Otherwise a function that queues the work given to it, e.g. to the application's main loop; it
  /// is called from threads of the library, must not block, and must keep the order.
  std::function<void(std::function<void()>)> executor = {};
};

/// Records this application through the device's recording daemon.
///
/// One per application. Making it does nothing yet: the first request connects. One recording goes
/// on at a time on the device: a start ends any other, also an own one.
///
/// Every request with a handler ends in one call of it, with an error where the daemon cannot be
/// reached (kErrorConnectionInvalid) or goes away meanwhile (kErrorConnectionInterrupted). A start
/// waits for the user's answer, so it may take long. Requests without an answer take a function that
/// is called only when the request could not be delivered.
///
/// Handlers and events do not run inside the call that brings them about, and never after the
/// destructor has returned: it waits for one that is running, except in that one itself. Destroying
/// the recorder ends the connection, and with it the recording: its movie is deleted.
///
/// Threading: thread-safe. Handlers and events run as RecorderOptions::executor says.
class QUORVEL_API Recorder {
 public:
  using FailureHandler = std::function<void(Error)>;
  using CompletionHandler = std::function<void(std::optional<Error>)>;

  static std::unique_ptr<Recorder> create(RecorderOptions options = {});
  virtual ~Recorder();
  Recorder(const Recorder&) = delete;
  Recorder& operator=(const Recorder&) = delete;

  // Recording

  /// Asks the user where needed, and starts. The application must be in front.
  virtual void start(StartOptions options, std::function<void(StartResult)> handler) = 0;
  virtual void stop(std::function<void(StopResult)> handler) = 0;
  virtual void stop(StopOptions options, std::function<void(StopResult)> handler) = 0;
  virtual void pause(FailureHandler onFailure = {}) = 0;
  /// `window` is recorded from here on; it must be this application's, or the recording ends.
  virtual void resume(uint32_t window, FailureHandler onFailure = {}) = 0;
  /// During a recording: silence on and off.
  virtual void setMicrophoneEnabled(bool enabled, FailureHandler onFailure = {}) = 0;
  /// Records the sound of process `pid` from here on, e.g. of a helper that plays it.
  virtual void updateProcessIDForAudioCapture(pid_t pid, FailureHandler onFailure = {}) = 0;
  /// Deletes the last recording's movie. An error during a recording.
  virtual void discard(CompletionHandler handler) = 0;
  /// Moves the movie of a stop to the user's photo library.
  virtual void saveVideoToCameraRoll(std::string movieURL, CompletionHandler handler) = 0;
  virtual void currentState(std::function<void(StateResult)> handler) = 0;

  // The application's place

  /// Tell when the application comes to the front and when it leaves it. The library repeats the
  /// last of the two on each new connection, so a failure needs no second try.
  virtual void didBecomeActive(FailureHandler onFailure = {}) = 0;
  virtual void didResignActive(FailureHandler onFailure = {}) = 0;
  /// While on, a lost daemon is looked for again (after 0.25 s, then less and less often, every 30 s at
  /// last). Off by default: then only the next request connects.
  virtual void keepConnected(bool keep) = 0;

  // Broadcasts

  virtual void setupBroadcast(BroadcastOptions options, CompletionHandler handler) = 0;
  virtual void currentBroadcastImages(std::function<void(BroadcastImagesResult)> handler) = 0;
  virtual void systemBroadcastExtensions(std::function<void(BroadcastExtensionsResult)> handler) = 0;
  virtual void setBroadcastURL(std::string url, FailureHandler onFailure = {}) = 0;

  // Remembered by the daemon for this application

  virtual void setHasUserConsentForCamera(bool consent, FailureHandler onFailure = {}) = 0;
  virtual void setHasUserConsentForMicrophone(bool consent, FailureHandler onFailure = {}) = 0;
  virtual void setMicrophoneEnabledPersistent(bool enabled, FailureHandler onFailure = {}) = 0;
  virtual void reportCameraUsage(int32_t cameraPosition, FailureHandler onFailure = {}) = 0;

  /// Captured samples that were dropped because the application's handlers did not keep up.
  [[nodiscard]] virtual uint64_t droppedSamples() const = 0;

 protected:
  Recorder() = default;
};

/// The path of a "file:///..." URL; empty for any other.
[[nodiscard]] QUORVEL_API std::string filePath(std::string_view url);
/// The name of a code, e.g. "RECORDING_ERROR_USER_DECLINED".
[[nodiscard]] QUORVEL_API std::string_view errorKey(int64_t code);

/// The form of a configuration in BroadcastOptions.
[[nodiscard]] QUORVEL_API std::vector<uint8_t> archivedConfiguration(const BroadcastConfiguration& configuration);

}  // namespace quorvel
