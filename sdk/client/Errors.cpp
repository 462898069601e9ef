#include "sdk/client/Errors.h"

#include <iterator>

#include "platform/IPC.h"

namespace quorvel {

namespace {

/// By code, from -5800 downwards.
constexpr std::string_view kErrorKeys[] = {
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
static_assert(std::size(kErrorKeys) == kErrorUnknown - kErrorMixingFailure + 1);

}  // namespace

std::string_view errorKey(int64_t code) {
  if (code > kErrorUnknown || code < kErrorMixingFailure) code = kErrorUnknown;
  return kErrorKeys[kErrorUnknown - code];
}

}  // namespace quorvel

namespace qv::client {

using quorvel::errorKey;

namespace {

/// The daemon's own texts are localized; these stand where it cannot be asked for them.
const char* libraryText(quorvel::ErrorCode code) {
  switch (code) {
    case quorvel::kErrorConnectionInvalid:
      return "The recording service cannot be reached.";
    case quorvel::kErrorConnectionInterrupted:
      return "The connection to the recording service was lost.";
    default:
      return "Recording failed for an unknown reason.";
  }
}

}  // namespace

quorvel::Error errorFromDaemon(const platform::Error& error) {
  const std::string text = error.localizedDescription();
  const std::string_view key = errorKey(error.domain == quorvel::kErrorDomain ? error.code : quorvel::kErrorUnknown);
  return {error.code, std::string(key), text.empty() ? std::string(key) : text, error.domain};
}

quorvel::Error libraryError(quorvel::ErrorCode code, const std::string& detail) {
  std::string text = libraryText(code);
  if (!detail.empty()) text += " (" + detail + ")";
  return {code, std::string(errorKey(code)), std::move(text), quorvel::kErrorDomain};
}

quorvel::Error errorForFailedCall(const platform::Error& error) {
  const bool ofMessaging = error.domain == platform::kIPCErrorDomain;
  if (ofMessaging && error.code == static_cast<int64_t>(platform::IPCErrorCode::ConnectionInvalid))
    return libraryError(quorvel::kErrorConnectionInterrupted);
  const std::string name = valueForKey(error.userInfo, platform::kIPCRemoteErrorNameKey).asString(error.domain);
  const std::string message = error.localizedDescription();
  return libraryError(quorvel::kErrorUnknown, message.empty() ? name : name + ": " + message);
}

}  // namespace qv::client
