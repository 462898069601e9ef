#pragma once

#include <cstdint>
#include <optional>

#include "platform/base/Error.h"
#include "platform/base/Value.h"
#include "protocol/RecordingErrorKeys.h"
#include "support/QVBundleTexts.h"

/// The errors that clients, extensions and the components of the daemon get: one domain, negative
/// codes, a localized text.
namespace qv {

/// The domain of every error of the system.
inline constexpr const char kQVRecordingErrorDomain[] = "com.tarnwick.Quorvel.QVRecordingErrorDomain";

/// What each code means to the one who gets it.
namespace errorcode {
/// Nothing more is known. Show the text; trying again may work.
inline constexpr int64_t kUnknown = -5800;
/// The user said no. Do not ask again by yourself.
inline constexpr int64_t kUserDeclined = -5801;
/// Recording is switched off on this device. Hide the function.
inline constexpr int64_t kDisabled = -5802;
/// The recording did not begin. Try again later.
inline constexpr int64_t kFailedToStart = -5803;
/// The recording broke off. What was written may be lost; start anew.
inline constexpr int64_t kFailed = -5804;
/// The disk is (nearly) full. Ask the user to free space, then start anew.
inline constexpr int64_t kInsufficientStorage = -5805;
/// Something else took the screen or the recorder. Start anew when in front again.
inline constexpr int64_t kInterrupted = -5806;
/// The recorded content changed its size. Start anew with the new size.
inline constexpr int64_t kContentResize = -5807;
/// The broadcast was never set up, or is gone. Set it up again before starting.
inline constexpr int64_t kInvalidBroadcastSession = -5808;
/// The device went to sleep. Start anew.
inline constexpr int64_t kSystemDormancy = -5809;
/// The caller lacks the entitlement for what it asked. Do not try again.
inline constexpr int64_t kEntitlements = -5810;
/// A call is going on. Try again after it.
inline constexpr int64_t kActivePhoneCall = -5811;
/// The movie could not be stored. Keep the user's other copy, if any; free space.
inline constexpr int64_t kFailedToSave = -5812;
/// The picture is being sent to another screen, which excludes recording. Try again after it.
inline constexpr int64_t kDashvex = -5813;
/// The connection to the daemon could not be made or is over. Connect anew.
inline constexpr int64_t kConnectionInvalid = -5814;
/// The daemon went away and may be back. Take the recording as lost, and start anew.
inline constexpr int64_t kConnectionInterrupted = -5815;
/// A window that was named is not the caller's. Name windows of your own.
inline constexpr int64_t kNoContextIDMatch = -5816;
/// The screen capture or the media services failed. Start anew.
inline constexpr int64_t kMediaServicesFailed = -5817;
/// The microphone could not be mixed into the movie. The unmixed movie is still there.
inline constexpr int64_t kMixingFailure = -5818;
}  // namespace errorcode

/// An error of the system's domain, for whoever makes one: a code, without a text. Its text is added where it leaves
/// the daemon, by `QuorvelErrors`, in the language that the user has then.
[[nodiscard]] inline platform::Error recordingError(int64_t code) { return {kQVRecordingErrorDomain, code, {}}; }

/// Errors as those get them who are outside the daemon: with a localized text.
///
/// Threading: thread-safe, blocking (reads a small file).
class QuorvelErrors {
 public:
  /// The texts are borrowed, and must outlive this.
  explicit QuorvelErrors(const QVBundleTexts& texts) : texts_(texts) {}

  /// An error with the localized text of `code` in the user information, in place of any text that
  /// `userInfo` has; without the framework's texts only the caller's entries. The code is kept even
  /// where it is none of the system's.
  [[nodiscard]] platform::Error _qvUserErrorForCode(
      int64_t code, const std::optional<platform::Dictionary>& userInfo = std::nullopt) const;
  /// As it crosses to a client: one of the system's that has no text yet gets it. Empty for none.
  [[nodiscard]] platform::Dictionary encoded(const std::optional<platform::Error>& error) const;

 private:
  const QVBundleTexts& texts_;
};

}  // namespace qv
