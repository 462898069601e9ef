#pragma once

// What both quorvel libraries hand to their users, and take from them: errors, values, samples.

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <variant>
#include <vector>

#define QUORVEL_API __attribute__((visibility("default")))

namespace quorvel {

/// What `Error::code` may be in `kErrorDomain`, and what to do about it.
enum ErrorCode : int64_t {
  kErrorUnknown = -5800,                  ///< Anything else; the text says more. Log it.
  kErrorUserDeclined = -5801,             ///< The user said no. Do not ask again by yourself.
  kErrorDisabled = -5802,                 ///< Recording is switched off on this device.
  kErrorFailedToStart = -5803,            ///< Not in front, or a window that is not yours.
  kErrorFailed = -5804,                   ///< The recording broke off.
  kErrorInsufficientStorage = -5805,      ///< Too little free space; tell the user.
  kErrorInterrupted = -5806,              ///< Another recording took over, or the app left the front.
  kErrorContentResize = -5807,            ///< The picture's size changed during the recording.
  kErrorInvalidBroadcastSession = -5808,  ///< No broadcast was set up, or its extension is gone.
  kErrorSystemDormancy = -5809,           ///< The device went to sleep.
  kErrorEntitlements = -5810,             ///< The application lacks the right to do this.
  kErrorActivePhoneCall = -5811,          ///< A call goes on; try after it. Not raised at present.
  kErrorFailedToSave = -5812,             ///< The movie could not be written.
  kErrorDashvex = -5813,                  ///< The picture is sent to another screen. Not raised at present.
  kErrorConnectionInvalid = -5814,        ///< The daemon cannot be reached. Try again later.
  kErrorConnectionInterrupted = -5815,    ///< The daemon went away meanwhile; a recording is lost.
  kErrorNoContextIDMatch = -5816,         ///< Resumed with a window that is not yours; recording ended.
  kErrorMediaServicesFailed = -5817,      ///< Screen or sound capture failed.
  kErrorMixingFailure = -5818,            ///< The movie's sound cannot be mixed. Not raised at present.
};

inline constexpr const char kErrorDomain[] = "com.tarnwick.Quorvel.QVRecordingErrorDomain";

/// What went wrong. In other domains than kErrorDomain the code is the domain's own, e.g. an errno in "posix".
struct Error {
  int64_t code = kErrorUnknown;
  std::string key = {};   ///< the code's name, e.g. "RECORDING_ERROR_USER_DECLINED"; that of kErrorUnknown elsewhere
  std::string text = {};  ///< for the user, in the user's language where it comes from the daemon; else in English
  std::string domain = kErrorDomain;
};

/// One entry of user information: nothing, a flag, a number, a text, bytes, or a container of these.
struct Value {
  using Array = std::vector<Value>;
  using Dictionary = std::map<std::string, Value>;
  std::variant<std::monostate, bool, int64_t, double, std::string, std::vector<uint8_t>, Array, Dictionary> content;
};
using Dictionary = Value::Dictionary;

/// Times of samples are on CLOCK_MONOTONIC. What a pause does to them is said where they are handed out.
using SampleTime = std::chrono::nanoseconds;

/// A captured picture. Copies share it. The pixels are shared with the daemon, which has few such
/// frames: the last copy that goes gives the frame back, so let go of it within a frame or two, and
/// copy out what you want to keep.
struct VideoFrame {
  std::span<const uint8_t> pixels;      ///< `height` rows from the top, each of `stride` bytes; read-only
  uint32_t width = 0, height = 0;       ///< pixels of 4 bytes: blue, green, red, and one without meaning
  uint32_t stride = 0;                  ///< bytes from one row to the next, at least 4 * width
  SampleTime presentationTime{0};       ///< when it is shown
  std::optional<SampleTime> duration;   ///< how long, where that is known; mostly it is not
  std::shared_ptr<const void> surface;  ///< keeps `pixels` readable
};

/// Linear PCM. It may be another in each sample: read it from there.
struct AudioFormat {
  double sampleRate = 0;        ///< frames per second
  uint32_t channels = 0;        ///< interleaved: a frame has a number of each
  uint32_t bitsPerChannel = 0;  ///< of one number
  uint32_t bytesPerFrame = 0;
  bool isFloat = false;      ///< IEEE numbers, otherwise integers
  bool isSigned = false;     ///< of integers
  bool isBigEndian = false;  ///< the order of the bytes of a number
};

/// A run of captured sound.
struct AudioSample {
  enum class Source { Application, Microphone };
  Source source = Source::Application;
  std::vector<uint8_t> bytes;  ///< at least frameCount * format.bytesPerFrame
  AudioFormat format;
  int64_t frameCount = 0;
  SampleTime presentationTime{0};      ///< of its first frame
  std::optional<SampleTime> duration;  ///< where it is known; it follows from frames and rate otherwise
};

/// The settings of a broadcast.
struct BroadcastConfiguration {
  /// Length of each movie clip in seconds, in clip mode: 0.5 to 600, and taken to the nearer of these beyond. 0: 5 s.
  double clipDuration = 0;
  /// Laid over the daemon's own settings of the clips: "AverageBitRate" (bits per second), "ExpectedSourceFrameRate",
  /// "MaxKeyFrameInterval" (frames), "ProfileLevel". docs/protocol.md has their bounds; other keys have no effect.
  Dictionary videoCompressionProperties = {};
};

}  // namespace quorvel
