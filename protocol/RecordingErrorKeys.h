#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

/// The names of the system's errors. They cross the wire as codes; the daemon and the client library both
/// name them by this table.
namespace qv {

inline constexpr int64_t kFirstRecordingErrorCode = -5800;

/// By distance from the first code, downward.
inline constexpr std::array kRecordingErrorKeys = {
    "RECORDING_ERROR_UNKNOWN",
    "RECORDING_ERROR_USER_DECLINED",
    "RECORDING_ERROR_DISABLED",
    "RECORDING_ERROR_FAILED_TO_START",
    "RECORDING_ERROR_FAILED",
    "RECORDING_ERROR_INSUFFICIENT_STORAGE",
    "RECORDING_ERROR_INTERRUPTED",
    "RECORDING_ERROR_CONTENT_RESIZE",
    "RECORDING_ERROR_INVALID_BROADCAST_SESSION",
    "RECORDING_ERROR_SYSTEM_DORMANCY",
    "RECORDING_ERROR_ENTITLEMENTS",
    "RECORDING_ERROR_ACTIVE_PHONE_CALL",
    "RECORDING_ERROR_FAILED_TO_SAVE",
    "RECORDING_ERROR_DASHVEX",
    "RECORDING_ERROR_CONNECTION_INVALID",
    "RECORDING_ERROR_CONNECTION_INTERRUPTED",
    "RECORDING_ERROR_NO_CONTEXTID_MATCH",
    "RECORDING_ERROR_MEDIASERVICES_FAILED",
    "RECORDING_ERROR_MIXING_FAILURE",
};
inline constexpr int64_t kLastRecordingErrorCode =
    kFirstRecordingErrorCode - static_cast<int64_t>(kRecordingErrorKeys.size()) + 1;

/// The key of a code, which is also that of its text in the strings table; the first one's for a code that is none of
/// the system's.
constexpr const char* localizationKeyForErrorCode(int64_t code) {
  if (code > kFirstRecordingErrorCode || code < kLastRecordingErrorCode) code = kFirstRecordingErrorCode;
  return kRecordingErrorKeys[static_cast<size_t>(kFirstRecordingErrorCode - code)];
}

}  // namespace qv
