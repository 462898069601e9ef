#include "platform/appstream/CatalogueText.h"

#include <glib.h>

namespace qv::platform::appstream {
namespace {

bool isPresentable(gunichar character) {
  switch (g_unichar_type(character)) {
    case G_UNICODE_CONTROL:
    case G_UNICODE_FORMAT:  // directions, invisible marks
    case G_UNICODE_LINE_SEPARATOR:
    case G_UNICODE_PARAGRAPH_SEPARATOR:
    case G_UNICODE_PRIVATE_USE:
    case G_UNICODE_SURROGATE:
    case G_UNICODE_UNASSIGNED:
      return false;
    default:
      return true;
  }
}

}  // namespace

std::optional<std::string> presentableText(const char* text) {
  if (text == nullptr || g_utf8_validate(text, -1, nullptr) == FALSE) return std::nullopt;
  std::string kept;
  bool hasContent = false;
  for (const char* at = text; *at != '\0'; at = g_utf8_next_char(at)) {
    const gunichar character = g_utf8_get_char(at);
    if (!isPresentable(character)) continue;
    const auto size = static_cast<size_t>(g_utf8_next_char(at) - at);
    if (kept.size() + size > kLongestText) break;
    kept.append(at, size);
    hasContent = hasContent || g_unichar_isspace(character) == FALSE;
  }
  return hasContent ? std::optional(kept) : std::nullopt;
}

}  // namespace qv::platform::appstream
