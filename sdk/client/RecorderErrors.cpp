#include "sdk/client/RecorderErrors.h"

#include "platform/IPC.h"
#include "protocol/RecordingErrors.h"

// Applications have the codes by names of their own.
#define QV_RECORDING_ERROR(code, name, key) static_assert(quorvel::kError##name == (code));
#include "protocol/RecordingErrors.def"
#undef QV_RECORDING_ERROR

namespace quorvel {

std::string_view errorKey(int64_t code) { return qv::localizationKeyForErrorCode(code); }

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
