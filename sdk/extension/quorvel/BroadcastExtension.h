#pragma once

// The quorvel extension library: write a broadcast upload extension, the program that sends a broadcast on.
//
//   class Upload final : public quorvel::SampleExtension {
//    public:
//     explicit Upload(quorvel::Broadcast& broadcast) : broadcast_(broadcast) {}
//     void started(quorvel::Dictionary userInfo) override { ... }
//     void processVideo(quorvel::VideoFrame frame, quorvel::Orientation orientation) override { ... }
//     ...
//   };
//   int main() { return quorvel::runExtension<Upload>(); }
//
// Link with `pkg-config --cflags --libs quorvel-extension`. docs/broadcast-extensions.md is the guide.

#include <quorvel/Types.h>

#include <concepts>
#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace quorvel {

/// How a picture lies, as an EXIF orientation code. Up: as it is shown.
enum class Orientation : uint32_t {
  Up = 1,
  UpMirrored = 2,
  Down = 3,
  DownMirrored = 4,
  LeftMirrored = 5,
  Right = 6,
  RightMirrored = 7,
  Left = 8,
};

// Sample mode -----------------------------------------------------------------------------------------

/// What an extension in sample mode may tell the application and the daemon. Nothing is answered, and nothing is sent
/// any more once the daemon has gone. It may be used from the constructor of the extension's object on: what is said
/// there arrives first, in its order, and `finishBroadcastWithError` there ends the broadcast before it has begun.
///
/// Threading: thread-safe, for as long as the extension's object lives.
class QUORVEL_API Broadcast {
 public:
  /// Anything the application may want to know of the service: viewers, state, bit rate. It replaces what was sent
  /// before. The application gets it as an event.
  virtual void updateServiceInfo(Dictionary serviceInfo) = 0;
  /// Where the broadcast can be watched.
  virtual void updateBroadcastURL(std::string url) = 0;
  /// The broadcast cannot go on: the recording ends, the application gets this error (domain, code and text as they
  /// are), and the process is killed soon. Once; later ones are not heard.
  virtual void finishBroadcastWithError(Error error) = 0;

 protected:
  virtual ~Broadcast();
};

/// An extension that is sent every sample: the manifest names "QVBroadcastProcessModeSampleBuffer".
///
/// One object for each broadcast, in a process of its own where the daemon launched it: made before its first call,
/// destroyed when the connection has ended. The destructor
/// is the place to close what `finished` did not get to, since a daemon that goes away calls nothing.
///
/// A call that returns late holds the others up. The daemon keeps a few samples (8 pictures, 2 s of sound), then drops
/// the oldest pictures: so hand work that takes more than a few milliseconds to a thread of your own, and let go of
/// frames soon (see VideoFrame): there are 8 of them.
///
/// The times of pictures and of sound lie on one timeline: CLOCK_MONOTONIC at their capture, less the pauses so far, to
/// the nanosecond. A pause takes away what lies between the last picture before it and the first one after it, so the
/// first picture after a pause has the time of the last one before. Sound that would then overlap what was given
/// already (by half a second at the most) is cut off: the times of each source only grow.
///
/// Threading: all calls come one at a time on one thread of the library, the destructor's too.
class QUORVEL_API SampleExtension {
 public:
  virtual ~SampleExtension();
  /// Once, first. `userInfo` is what the application gave with the set-up of the broadcast.
  virtual void started(Dictionary userInfo) = 0;
  /// No samples come until `resumed`.
  virtual void paused() {}
  /// Samples come again, on the timeline that the comment of the class describes.
  virtual void resumed() {}
  /// Once, last. The process is killed as soon as this has returned: send what is left before, in a few seconds.
  virtual void finished() = 0;
  /// A picture, where what is shown has changed (30 a second at most), and at least two a second of a screen that
  /// stands still.
  virtual void processVideo(VideoFrame frame, Orientation orientation) = 0;
  /// A run of the application's sound, or of the microphone's.
  virtual void processAudio(AudioSample sample) = 0;
  /// Once for a broadcast, the bundle identifier of the application in front: right after `started`, before any sample;
  /// where no application is in front then, with the first that comes to the front.
  virtual void frontmostApplication(std::string /*bundleID*/) {}
};
/// Makes the object of a broadcast, on the library's thread; the Broadcast outlives it. Never nothing.
using SampleExtensionFactory = std::function<std::unique_ptr<SampleExtension>(Broadcast&)>;

// Clip mode -------------------------------------------------------------------------------------------

/// A piece of the broadcast: a whole MPEG-4 movie (H.264 and AAC) whose times begin at 0. Clips come in order and
/// follow each other without a gap.
struct Clip {
  /// Open for reading, at its start; seekable. Closed with the last copy of `holder`. There is no path: an extension
  /// may read this file only, and only through this descriptor.
  int file = -1;
  std::string name;     ///< the file's name; ends in "_N.mp4", where N counts the clips of one broadcast from 1
  bool isLast = false;  ///< of the broadcast; the process is ended when it is done, two minutes after it at the latest
  Dictionary userInfo;  ///< what the application gave with the set-up of the broadcast
  std::shared_ptr<const void> holder;  ///< keeps `file` open
};

/// What an extension has to say with the end of a clip; both may be empty.
struct ClipResult {
  std::optional<BroadcastConfiguration> configuration = {};  ///< from the next clip on
  std::optional<Dictionary> serviceInfo = {};                ///< for the application
};
/// Ends a clip, once: the daemon removes its file then. Call it from any thread, at any time. When the last copy goes
/// uncalled, the clip ends with an empty result.
using ClipCompletion = std::function<void(ClipResult)>;

/// An extension that is sent clips: the manifest names no process mode. One object for the life of the process, which
/// takes one broadcast; it sees a later part of one only where a former process of the broadcast has died.
///
/// Threading: as of SampleExtension.
class QUORVEL_API ClipExtension {
 public:
  virtual ~ClipExtension();
  /// Further clips wait until this returns; their files stay on the disk meanwhile.
  virtual void processClip(Clip clip, ClipCompletion done) = 0;
};
/// Makes the one object of the process, on the library's thread. Never nothing.
using ClipExtensionFactory = std::function<std::unique_ptr<ClipExtension>()>;

// Running ---------------------------------------------------------------------------------------------

/// Serve the daemon that launched this process, until it has gone. The result is for main to return; 2, with a line on
/// standard error, where no daemon launched it. An extension call that still runs 5 s after the daemon has gone is cut
/// off by the end of the process.
QUORVEL_API int runSampleExtension(SampleExtensionFactory make);
QUORVEL_API int runClipExtension(ClipExtensionFactory make);

template <std::derived_from<SampleExtension> T>
int runExtension() {
  return runSampleExtension([](Broadcast& broadcast) { return std::make_unique<T>(broadcast); });
}
template <std::derived_from<ClipExtension> T>
int runExtension() {
  return runClipExtension([] { return std::make_unique<T>(); });
}

/// The other way to connect: a program that already runs, e.g. a helper of the application's, takes broadcasts in
/// sample mode. Hand the endpoint to the application (as a descriptor over a socket), which gives it to its start
/// (StartOptions::listenerEndpoint).
///
/// Destroying it ends its broadcasts: their objects are gone when the destructor returns.
///
/// Threading: thread-safe; not to be destroyed within a call of an extension's object.
class QUORVEL_API BroadcastListener {
 public:
  /// Nothing where the system is out of descriptors. `make` makes the object of each broadcast.
  static std::unique_ptr<BroadcastListener> create(SampleExtensionFactory make);
  virtual ~BroadcastListener();
  BroadcastListener(const BroadcastListener&) = delete;
  BroadcastListener& operator=(const BroadcastListener&) = delete;
  /// The right to connect to this listener. Belongs to it: duplicate it to keep it.
  [[nodiscard]] virtual int endpoint() const = 0;

 protected:
  BroadcastListener() = default;
};

}  // namespace quorvel
