#include "support/QuorvelErrors.h"

#include <array>
#include <utility>

#include "support/QVExtensions.h"

namespace qv {
namespace {

/// By distance from kUnknown, downward.
constexpr std::array kKeys = {
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
static_assert(kKeys.size() == errorcode::kUnknown - errorcode::kMixingFailure + 1);

}  // namespace

const char* localizationKeyForErrorCode(int64_t code) {
  if (code > errorcode::kUnknown || code < errorcode::kMixingFailure) code = errorcode::kUnknown;
  return kKeys[static_cast<size_t>(errorcode::kUnknown - code)];
}

platform::Error _qvUserErrorForCode(int64_t code, const std::optional<platform::Dictionary>& userInfo) {
  platform::Dictionary information = userInfo.value_or(platform::Dictionary{});
  if (auto text = _qvLocalizedStringFromFrameworkBundleWithKey(localizationKeyForErrorCode(code))) {
    information.insert_or_assign(platform::kLocalizedDescriptionKey, platform::Value(std::move(*text)));
  }
  return {kQVRecordingErrorDomain, code, std::move(information)};
}

}  // namespace qv
