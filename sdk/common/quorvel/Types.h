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
  kErrorActivePhoneCall = -5811,
  kErrorFailedToSave = -5812,  ///< The movie could not be written.
  kErrorDashvex = -5813,
  kErrorConnectionInvalid = -5814,      ///< The daemon cannot be reached. Try again later.
  kErrorConnectionInterrupted = -5815,  ///< The daemon went away meanwhile; a recording is lost.
  kErrorNoContextIDMatch = -5816,       ///< Resumed with a window that is not yours; recording ended.
  kErrorMediaServicesFailed = -5817,    ///< Screen or sound capture failed.
  kErrorMixingFailure = -5818,
};

inline constexpr const char kErrorDomain[] = "com.tarnwick.Quorvel.QVRecordingErrorDomain";

struct Error {
  int64_t code = kErrorUnknown;
  std::string key = {};   ///< its name, e.g. "RECORDING_ERROR_USER_DECLINED"
  std::string text = {};  ///< for the user, in the user's language where it comes from the daemon
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
  std::span<const uint8_t> pixels;  ///< BGRX, 4 bytes a pixel, `stride` bytes a row, read-only
  uint32_t width = 0, height = 0, stride = 0;
  SampleTime presentationTime{0};
  std::optional<SampleTime> duration;
  std::shared_ptr<const void> surface;  ///< keeps `pixels` readable
};

struct AudioFormat {
  double sampleRate = 0;  ///< frames per second
  uint32_t channels = 0;  ///< interleaved
  uint32_t bitsPerChannel = 0;
  uint32_t bytesPerFrame = 0;
  bool isFloat = false;
  bool isSigned = false;
  bool isBigEndian = false;
};

/// A run of captured sound, linear PCM.
struct AudioSample {
  enum class Source { Application, Microphone };
  Source source = Source::Application;
  std::vector<uint8_t> bytes;
  AudioFormat format;
  int64_t frameCount = 0;
  SampleTime presentationTime{0};
  std::optional<SampleTime> duration;
};

/// The settings of a broadcast.
struct BroadcastConfiguration {
  /// Length of each movie clip in seconds, in clip mode. 0: the daemon's own, 5 s.
  double clipDuration = 0;
  /// Laid over the movie writer's compression settings.
  Dictionary videoCompressionProperties = {};
};

}  // namespace quorvel
