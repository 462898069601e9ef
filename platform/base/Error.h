#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "platform/base/Value.h"

namespace qv::platform {

/// The user-information entry that holds an error's localized text.
inline constexpr const char kLocalizedDescriptionKey[] = "localizedDescription";
/// The domain of errors whose code is an errno.
inline constexpr const char kPosixErrorDomain[] = "posix";

/// What went wrong: a domain, a code within it, and user information.
struct Error {
  std::string domain;
  int64_t code = 0;
  Dictionary userInfo;

  bool operator==(const Error&) const = default;
  /// The localized text, or the empty string.
  [[nodiscard]] std::string localizedDescription() const;
  /// domain, code and text for a log line.
  [[nodiscard]] std::string description() const;
  /// An error for an errno, with the C library's text as its description.
  static Error posix(int errnum, const std::string& context = {});
};

/// The one encoding of an error in messages: {domain: s, code: x, userInfo: a{sv}}; no error is
/// the empty dictionary.
Dictionary encodeError(const std::optional<Error>& error);
std::optional<Error> decodeError(const Dictionary& dictionary);

}  // namespace qv::platform
