#include "ui/LocalizedTexts.h"

#include "support/QVBundleTexts.h"

namespace qv {

std::string localizedText(const char* key) { return _qvLocalizedStringFromFrameworkBundleWithKey(key).value_or(key); }

std::string formatted(std::string format, const std::string& argument) {
  const size_t position = format.find("%@");
  if (position != std::string::npos) format.replace(position, 2, argument);
  return format;
}

}  // namespace qv
