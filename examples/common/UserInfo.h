#pragma once

#include <quorvel/Types.h>

#include <cstdlib>
#include <string>

namespace upload {

/// A text of the application's; empty where there is none.
inline std::string textIn(const quorvel::Dictionary& info, const char* key) {
  const auto entry = info.find(key);
  if (entry == info.end()) return {};
  const auto* text = std::get_if<std::string>(&entry->second.content);
  return text ? *text : std::string();
}

/// A number of the application's, also one given as a text, within bounds; else `fallback`.
inline double numberIn(const quorvel::Dictionary& info, const char* key, double fallback, double least, double most) {
  const auto entry = info.find(key);
  if (entry == info.end()) return fallback;
  double number = fallback;
  if (const auto* integer = std::get_if<int64_t>(&entry->second.content)) number = static_cast<double>(*integer);
  if (const auto* real = std::get_if<double>(&entry->second.content)) number = *real;
  if (const auto* text = std::get_if<std::string>(&entry->second.content)) number = std::strtod(text->c_str(), nullptr);
  return number >= least && number <= most ? number : fallback;
}

}  // namespace upload
