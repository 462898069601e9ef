#include "platform/base/Error.h"

#include <system_error>

namespace qv::platform {

std::string Error::localizedDescription() const { return valueForKey(userInfo, kLocalizedDescriptionKey).asString(); }

std::string Error::description() const {
  std::string text = domain + " " + std::to_string(code);
  const std::string localized = localizedDescription();
  return localized.empty() ? text : text + " (" + localized + ")";
}

Error Error::posix(int errnum, const std::string& context) {
  std::string text = std::generic_category().message(errnum);
  if (!context.empty()) text = context + ": " + text;
  return {kPosixErrorDomain, errnum, {{kLocalizedDescriptionKey, Value(text)}}};
}

Dictionary encodeError(const std::optional<Error>& error) {
  if (!error) return {};
  return {{"domain", Value(error->domain)}, {"code", Value(error->code)}, {"userInfo", Value(error->userInfo)}};
}

std::optional<Error> decodeError(const Dictionary& dictionary) {
  if (dictionary.empty()) return std::nullopt;
  return Error{valueForKey(dictionary, "domain").asString(), valueForKey(dictionary, "code").asInteger(),
               valueForKey(dictionary, "userInfo").asDictionary()};
}

}  // namespace qv::platform
