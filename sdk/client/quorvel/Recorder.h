#pragma once

// The quorvel client library: record this application's own screen and sound.
//
//   auto recorder = quorvel::Recorder::create();
//   recorder->start({.windows = {window}, .width = 1280, .height = 720},
//                   [](quorvel::StartResult started) { ... });
//   ...
//   recorder->stop([](quorvel::StopResult stopped) { save(stopped.movieURL); });
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

// The fields of a result are empty where it has an `error`, unless the field says otherwise. Codes that any request may
// bring are said at Recorder; those of one request stand at it. They are of ErrorCode (Types.h) unless another domain
// is named.

struct StartOptions {
  /// The windows (layer contexts) to record: X11 window ids on X11. 64 at most, each of this application; not read
  /// where `system` is set.
  std::vector<uint32_t> windows = {};
  /// Size of the recorded picture in pixels, 1 to 1 000 000 a side. A larger one than the device records is scaled down
  /// in its shape: to 1920 a side, or 1600 on small tablets.
  double width = 0, height = 0;
  bool microphone = false;  ///< ask for the microphone too
  bool camera = false;      ///< ask for the camera too; the daemon opens none at present
  bool broadcast = false;   ///< send to the extension of `setupBroadcast` instead of into a movie
  bool system = false;      ///< the whole screen; needs the entitlement "com.tarnwick.private.quorvel"
  bool capture = false;     ///< no movie: the samples come to `Events::videoFrame` and `audioSample`
  /// A broadcast extension's endpoint, where the application has one. Borrowed: it is duplicated.
  int listenerEndpoint = -1;
};

/// What is recorded: asked for, there on the device, and allowed by the user.
struct StartResult {
  std::optional<Error> error;
  bool microphone = false;
  bool camera = false;  ///< always false at present
};

/// Cuts so many seconds off the movie, where both are positive; otherwise, and where cutting fails, it stays whole.
struct StopOptions {
  std::chrono::duration<double> startClip{0};  ///< off its start
  std::chrono::duration<double> endClip{0};    ///< off its end
};

/// Of a stop: a movie, or an error; both where the disk failed, and then the movie ends early. Neither after a capture
/// or a broadcast: there is no movie then. Of Events::stopped: an error, perhaps with a movie.
struct StopResult {
  std::optional<Error> error;
  std::string movieURL;  ///< "file:///..."; empty for no movie. To read it: Recorder::openMovie.
};

/// A movie that is open for reading.
struct OpenMovieResult {
  std::optional<Error> error;
  /// At its start, and seekable; -1 with an error. Closed with the last copy of `holder`. Read it by this descriptor:
  /// it cannot be opened again by a path, /proc/self/fd included, where the daemon is another user.
  int file = -1;
  std::shared_ptr<const void> holder;  ///< keeps `file` open
};

struct BroadcastOptions {
  std::string hostBundleID = {};  ///< this application's own; another's needs the entitlement of `StartOptions::system`
  /// Of the extension. All but its last component counts: the first installed upload extension whose identifier begins
  /// so is taken.
  std::string extensionBundleID = {};
  std::vector<uint8_t> configuration = {};  ///< of archivedConfiguration(); 1 MiB at most
  Dictionary userInfo = {};                 ///< handed to the extension as it is
};

/// PNG images; empty where there is none.
struct BroadcastImagesResult {
  std::optional<Error> error;
  std::vector<uint8_t> hostApp;
  std::vector<uint8_t> extension;
};

struct BroadcastExtension {
  std::string displayName;    ///< for the user; empty without
  std::string bundleID;       ///< for BroadcastOptions::extensionBundleID
  std::vector<uint8_t> icon;  ///< PNG, 1 MiB at most; empty without
};
struct BroadcastExtensionsResult {
  std::optional<Error> error;
  std::vector<BroadcastExtension> extensions;  ///< all that are installed, in a steady order
};

/// What the daemon knows of this application; all of it empty where the application is in no bundle.
struct State {
  bool recording = false;  ///< from the user's consent on, in a pause too
  bool broadcasting = false;
  bool microphoneEnabled = false;            ///< of the recording
  bool systemRecording = false;              ///< whether the recording is one of the whole screen
  bool userConsentForMicrophone = false;     ///< of setHasUserConsentForMicrophone
  bool userConsentForCamera = false;         ///< of setHasUserConsentForCamera
  bool microphoneEnabledPersistent = false;  ///< of setMicrophoneEnabledPersistent
  std::optional<std::string> broadcastURL;   ///< where the broadcast can be watched
};
struct StateResult {
  std::optional<Error> error;
  State state;
};

/// What happens without having been asked for. Every entry may be empty.
struct Events {
  /// The recording ended, and neither by this application's stop nor because a later start of its own took its place:
  /// with an error, and with the URL of its movie where this application may save or discard it. The codes:
  /// kErrorInterrupted, kErrorInsufficientStorage, kErrorContentResize, kErrorInvalidBroadcastSession,
  /// kErrorFailedToSave, kErrorNoContextIDMatch, kErrorMediaServicesFailed, kErrorConnectionInterrupted, or whatever
  /// error an extension ended its broadcast with. One of kErrorInterrupted whose movie still waits is told a second
  /// time, at the first `didBecomeActive` during a later recording.
  std::function<void(StopResult)> stopped = {};
  /// The daemon went away: once for each loss. Outstanding requests have ended by then, and so has the
  /// recording. The next request connects anew.
  std::function<void()> interrupted = {};
  /// A connection to the daemon was made: the first, or one after an interruption.
  std::function<void()> connected = {};
  /// With the system's entitlement: something begins or ends to be recorded, for whichever application.
  std::function<void(bool recording)> recordingStateChanged = {};
  /// Whatever the extension of the broadcast tells of its service; it replaces what came before.
  std::function<void(Dictionary)> broadcastServiceInfoChanged = {};
  /// Where the broadcast can be watched, as its extension says.
  std::function<void(std::string url)> broadcastURLChanged = {};
  /// Of a capture: a picture when what is shown has changed (60 a second at most), and of a screen that stands still at
  /// least two a second. Where 3 wait for the executor, a new one is dropped. The times of pictures and of sound lie on
  /// one timeline: CLOCK_MONOTONIC at their capture, less the pauses so far, to the nanosecond. A pause takes away what
  /// lies between the last picture before it and the first one after it, so the first picture after a pause has the
  /// time of the last one before. Sound that would then overlap what was given already (by half a second at the most)
  /// is cut off: the times of each source only grow.
  std::function<void(VideoFrame)> videoFrame = {};
  /// Of a capture: a run of sound of one source. Where 64 wait for the executor, a new one is dropped.
  std::function<void(AudioSample)> audioSample = {};
  /// No daemon sends this at present.
  std::function<void(Error)> recordingLockInterrupted = {};
  /// With the system's entitlement: how long that has been recorded, without pauses, as "1:05".
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
/// Every request with a handler ends in one call of it. Its error may always be kErrorConnectionInvalid (the daemon
/// cannot be reached), kErrorConnectionInterrupted (it went away meanwhile), or kErrorUnknown (it refused the call; the
/// text has the reason). Requests without an answer take a function that is called, with one of these, only when the
/// request could not be delivered. Either may be empty.
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

  /// Never nothing.
  static std::unique_ptr<Recorder> create(RecorderOptions options = {});
  virtual ~Recorder();
  Recorder(const Recorder&) = delete;
  Recorder& operator=(const Recorder&) = delete;

  // Recording

  /// Asks the user where needed, and starts; so it may take long. A broadcast asks nobody, and waits for its extension:
  /// 20 s at most. The application must be in front, unless it records the system. Once
  /// windows, size and rights are found good, whatever records on the device is ended, also where this start is refused
  /// later on.
  ///
  /// kErrorUserDeclined; kErrorFailedToStart: not in front, no bundle, a window that is not this application's, a size
  /// that is none, another start on its way; kErrorInsufficientStorage: 100 000 000 bytes free or less;
  /// kErrorEntitlements; kErrorInvalidBroadcastSession: no broadcast was set up, or its extension did not get ready;
  /// kErrorInterrupted: ended before it began; for a broadcast also the domain "posix", or the extension's own.
  virtual void start(StartOptions options, std::function<void(StartResult)> handler) = 0;
  /// Ends the recording; the answer comes when its movie is complete. One that is sent before the start has ended waits
  /// for that, once the user has allowed the recording.
  ///
  /// kErrorFailedToSave: there is no movie; kErrorUnknown: nothing is being recorded.
  virtual void stop(std::function<void(StopResult)> handler) = 0;
  virtual void stop(StopOptions options, std::function<void(StopResult)> handler) = 0;
  /// Nothing is recorded until `resume`: the pause is not in the movie, and a capture gets no samples. A broadcast
  /// stays paused until its stop. No effect on a system recording, and while nothing records.
  virtual void pause(FailureHandler onFailure = {}) = 0;
  /// `window` is recorded from here on; it must be this application's, or the recording ends (`Events::stopped`) with
  /// kErrorNoContextIDMatch and its movie. No effect where nothing is paused.
  virtual void resume(uint32_t window, FailureHandler onFailure = {}) = 0;
  /// During a recording: false puts silence in place of the microphone's sound. It does not bring a microphone into an
  /// application's recording that was started without; a system recording takes one when it is first switched on.
  virtual void setMicrophoneEnabled(bool enabled, FailureHandler onFailure = {}) = 0;
  /// During a recording: records the sound of process `pid` from here on, e.g. of a helper that plays it; of nobody
  /// with 0 or less. A process of another bundle has no effect without the entitlement of `StartOptions::system`.
  virtual void updateProcessIDForAudioCapture(pid_t pid, FailureHandler onFailure = {}) = 0;
  /// Deletes the movie that this application was handed last, unless it is saved already; no error where there is none.
  ///
  /// kErrorUnknown: during a recording, or for an application in no bundle.
  virtual void discard(CompletionHandler handler) = 0;
  /// Moves a movie to the user's photo library, its sound mixed into one track. `movieURL` is that of a StopResult.
  ///
  /// kErrorFailedToSave: not this application's movie, gone, saved already, or being saved. Any other error is the
  /// library's, e.g. of the domain "posix": the movie stays, and can be saved again.
  virtual void saveVideoToCameraRoll(std::string movieURL, CompletionHandler handler) = 0;
  /// What the daemon knows of this application now.
  virtual void currentState(std::function<void(StateResult)> handler) = 0;

  // The application's place

  /// Tell when the application comes to the front and when it leaves it. The library repeats the last of the two on
  /// each new connection, so a failure needs no second try. The user's consent lapses when the application comes to the
  /// front, or connects, more than 480 s after it went to the background.
  virtual void didBecomeActive(FailureHandler onFailure = {}) = 0;
  virtual void didResignActive(FailureHandler onFailure = {}) = 0;
  /// While on, a lost daemon is looked for again (after 0.25 s, then less and less often, every 30 s at
  /// last). Off by default: then only the next request connects.
  virtual void keepConnected(bool keep) = 0;

  // Broadcasts

  /// Names the extension of the next broadcast, and what it is told. For one broadcast: a set-up is over when that
  /// ends, but stays where its extension never got ready; a later one replaces it.
  ///
  /// kErrorInvalidBroadcastSession: no such extension, or a configuration that is none; kErrorEntitlements: of another
  /// application, without the right.
  virtual void setupBroadcast(BroadcastOptions options, CompletionHandler handler) = 0;
  /// The icons of the application and the extension that were set up last on this device, until the next stop.
  virtual void currentBroadcastImages(std::function<void(BroadcastImagesResult)> handler) = 0;
  /// The installed upload extensions, of all applications. The error may be of another domain, where they could not be
  /// looked for.
  virtual void systemBroadcastExtensions(std::function<void(BroadcastExtensionsResult)> handler) = 0;
  /// Sets State::broadcastURL; the empty text takes it away. It has no other effect.
  virtual void setBroadcastURL(std::string url, FailureHandler onFailure = {}) = 0;

  // Remembered by the daemon for this application, while it is connected

  /// Sets State::userConsentForCamera. It has no other effect.
  virtual void setHasUserConsentForCamera(bool consent, FailureHandler onFailure = {}) = 0;
  /// Sets State::userConsentForMicrophone. It has no other effect.
  virtual void setHasUserConsentForMicrophone(bool consent, FailureHandler onFailure = {}) = 0;
  /// Sets State::microphoneEnabledPersistent. It has no other effect.
  virtual void setMicrophoneEnabledPersistent(bool enabled, FailureHandler onFailure = {}) = 0;
  /// During a recording: the application uses a camera, 1 the back one, 2 the front one. It goes into the recording's
  /// metrics; other positions are ignored.
  virtual void reportCameraUsage(int32_t cameraPosition, FailureHandler onFailure = {}) = 0;

  /// Captured samples that were dropped because the application's handlers did not keep up, pictures and sound
  /// together, over the recorder's life. From any thread.
  [[nodiscard]] virtual uint64_t droppedSamples() const = 0;

  // What came later stands last, where programs that are built already do not look.

  /// Opens a movie that this application was handed: `movieURL` is that of a StopResult. The file at the URL is for the
  /// daemon alone where that runs as another user, so this is how an application reads its movie. What is open stays
  /// readable, also when the movie is saved, discarded or replaced meanwhile; it takes up the disk for as long.
  ///
  /// kErrorFailedToSave: not this application's movie, gone, saved already, or being saved. Any other error is the
  /// system's, of the domain "posix".
  virtual void openMovie(std::string movieURL, std::function<void(OpenMovieResult)> handler) = 0;

 protected:
  Recorder() = default;
};

/// The path of a "file:///..." URL; empty for any other.
[[nodiscard]] QUORVEL_API std::string filePath(std::string_view url);
/// The name of a code, e.g. "RECORDING_ERROR_USER_DECLINED"; "RECORDING_ERROR_UNKNOWN" for one that is none of
/// ErrorCode.
[[nodiscard]] QUORVEL_API std::string_view errorKey(int64_t code);

/// The form of a configuration in BroadcastOptions.
[[nodiscard]] QUORVEL_API std::vector<uint8_t> archivedConfiguration(const BroadcastConfiguration& configuration);

}  // namespace quorvel
