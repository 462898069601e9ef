#pragma once

#include <cstdint>
#include <optional>

#include "platform/base/Error.h"
#include "platform/base/Value.h"
#include "protocol/RecordingErrors.h"
#include "support/QVBundleTexts.h"

/// The errors that clients, extensions and the components of the daemon get: one domain, negative
/// codes, a localized text.
namespace qv {

/// The domain of every error of the system.
inline constexpr const char kQVRecordingErrorDomain[] = "com.tarnwick.Quorvel.QVRecordingErrorDomain";

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
