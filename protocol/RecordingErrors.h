#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

/// The system's errors, made from RecordingErrors.def, which says what each means. The daemon and the client library
/// both name them by this table.
namespace qv {

/// The codes: kUnknown, kUserDeclined, and so on.
namespace errorcode {
#define QV_RECORDING_ERROR(code, name, key) inline constexpr int64_t k##name = code;
#include "protocol/RecordingErrors.def"
#undef QV_RECORDING_ERROR
}  // namespace errorcode

struct RecordingError {
  int64_t code;
  const char* key;
};
inline constexpr std::array kRecordingErrors = {
#define QV_RECORDING_ERROR(code, name, key) RecordingError{code, "RECORDING_ERROR_" #key},
#include "protocol/RecordingErrors.def"
#undef QV_RECORDING_ERROR
};

/// The key of a code, which is also that of its text in the strings table; the first one's for a code that is none of
/// the system's.
constexpr const char* localizationKeyForErrorCode(int64_t code) {
  for (const RecordingError& error : kRecordingErrors) {
    if (error.code == code) return error.key;
  }
  return kRecordingErrors.front().key;
}

constexpr bool recordingErrorsHaveNoGap() {
  for (size_t i = 0; i < kRecordingErrors.size(); ++i) {
    if (kRecordingErrors[i].code != kRecordingErrors.front().code - static_cast<int64_t>(i)) return false;
  }
  return true;
}
static_assert(recordingErrorsHaveNoGap());

}  // namespace qv
