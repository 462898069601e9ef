#include "tools/quorvelctl/Wording.h"

#include <array>
#include <cmath>
#include <cstdio>
#include <ctime>

namespace ctl {

namespace {

bool continuesCharacter(char byte) { return (static_cast<unsigned char>(byte) & 0xC0) == 0x80; }

size_t lengthOf(const std::string& text) {
  size_t count = 0;
  for (const char byte : text) count += continuesCharacter(byte) ? 0 : 1;
  return count;
}

}  // namespace

std::string clockText(double seconds) {
  const auto whole = static_cast<long long>(std::fmax(seconds, 0));
  std::array<char, 32> text;
  if (whole < 3600) {
    std::snprintf(text.data(), text.size(), "%lld:%02lld", whole / 60, whole % 60);
  } else {
    std::snprintf(text.data(), text.size(), "%lld:%02lld:%02lld", whole / 3600, whole / 60 % 60, whole % 60);
  }
  return text.data();
}

std::string sizeText(uint64_t bytes) {
  if (bytes < 1000) return std::to_string(bytes) + " B";
  auto value = static_cast<double>(bytes);
  size_t unit = 0;
  for (; value >= 999.95 && unit < 4; ++unit) value /= 1000;
  std::array<char, 32> text;
  std::snprintf(text.data(), text.size(), "%.1f %cB", value, " kMGT"[unit]);
  return text.data();
}

std::string dateText(double seconds) {
  const auto time = static_cast<std::time_t>(seconds);
  std::tm local{};
  std::array<char, 32> text{};
  if (::localtime_r(&time, &local) == nullptr) return "?";
  std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M:%S", &local);
  return text.data();
}

std::string cutTo(const std::string& text, size_t characters) {
  size_t count = 0;
  for (size_t at = 0; at < text.size(); ++at) {
    if (!continuesCharacter(text[at]) && count++ == characters) return text.substr(0, at);
  }
  return text;
}

std::string fitted(const std::vector<std::string>& parts, size_t characters) {
  std::string line;
  for (const std::string& part : parts) {
    if (part.empty()) continue;
    if (line.empty()) {
      line = cutTo(part, characters);
    } else if (lengthOf(line) + 2 + lengthOf(part) <= characters) {
      line += "  " + part;
    }
  }
  return line;
}

std::string printable(const std::string& text) {
  std::string clean = text;
  for (char& byte : clean) {
    if (static_cast<unsigned char>(byte) < 0x20 || byte == 0x7f) byte = '?';
  }
  return clean;
}

}  // namespace ctl
