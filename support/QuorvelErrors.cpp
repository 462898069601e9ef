#include "support/QuorvelErrors.h"

#include <utility>

#include "support/QVBundleTexts.h"

namespace qv {

static_assert(errorcode::kUnknown == kFirstRecordingErrorCode && errorcode::kMixingFailure == kLastRecordingErrorCode);

platform::Error _qvUserErrorForCode(int64_t code, const std::optional<platform::Dictionary>& userInfo) {
  platform::Dictionary information = userInfo.value_or(platform::Dictionary{});
  if (auto text = _qvLocalizedStringFromFrameworkBundleWithKey(localizationKeyForErrorCode(code))) {
    information.insert_or_assign(platform::kLocalizedDescriptionKey, platform::Value(std::move(*text)));
  }
  return {kQVRecordingErrorDomain, code, std::move(information)};
}

}  // namespace qv
