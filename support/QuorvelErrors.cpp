#include "support/QuorvelErrors.h"

#include <utility>

namespace qv {

platform::Error QuorvelErrors::_qvUserErrorForCode(int64_t code,
                                                   const std::optional<platform::Dictionary>& userInfo) const {
  platform::Dictionary information = userInfo.value_or(platform::Dictionary{});
  if (auto text = texts_._qvLocalizedStringFromFrameworkBundleWithKey(localizationKeyForErrorCode(code))) {
    information.insert_or_assign(platform::kLocalizedDescriptionKey, platform::Value(std::move(*text)));
  }
  return {kQVRecordingErrorDomain, code, std::move(information)};
}

platform::Dictionary QuorvelErrors::encoded(const std::optional<platform::Error>& error) const {
  const bool lacksText = error && error->domain == kQVRecordingErrorDomain &&
                         platform::find(error->userInfo, platform::kLocalizedDescriptionKey) == nullptr;
  return platform::encodeError(lacksText ? _qvUserErrorForCode(error->code, error->userInfo) : error);
}

}  // namespace qv
