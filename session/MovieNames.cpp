#include "session/MovieNames.h"

#include <algorithm>

namespace qv {

namespace {

constexpr size_t kMaximumNameBytes = 200;  // leaves room for suffixes within a name of 255 bytes

/// A display name as one path component: it may hold anything that a person would call an app.
std::string fileNameFromDisplayName(std::string name) {
  std::replace(name.begin(), name.end(), '/', ':');
  std::erase_if(name, [](unsigned char c) { return c < 0x20 || c == 0x7f; });
  if (name.size() > kMaximumNameBytes) {
    size_t end = kMaximumNameBytes;
    while (end > 0 && (static_cast<unsigned char>(name[end]) & 0xC0) == 0x80) --end;
    name.resize(end);
  }
  if (!name.empty() && name.front() == '.') name.front() = '_';
  return name;
}

}  // namespace

std::string MovieNames::movieName(const std::string& bundleID) const {
  const auto displayName = texts_._qvLocalizedAppNameFromBundleID(bundleID);
  const std::string name = fileNameFromDisplayName(displayName.value_or(std::string()));
  return name.empty() ? fileNameFromDisplayName(bundleID) : name;
}

std::string MovieNames::applicationMoviePath(const std::string& bundleID) const {
  return files_.pathInStore(movieName(bundleID) + ".mp4");
}

std::string MovieNames::screenMoviePath() const {
  std::string date = platform_.localization->formatDate(platform_.clock->now(), "MM-dd-yyyy HH:mm:ss");
  std::replace(date.begin(), date.end(), ':', '-');
  return files_.pathInStore("ScreenRecording_" + date + ".mp4");
}

std::string MovieNames::clipPath(const std::string& bundleID, int64_t broadcastFragmentIndex) const {
  return files_.pathInStore("QVMovie_" + fileNameFromDisplayName(bundleID) + "_" +
                            std::to_string(platform_.clock->now().secondsSince1970) + "_" +
                            std::to_string(broadcastFragmentIndex) + ".mp4");
}

std::string MovieNames::trimmedOutputPath(const std::string& bundleID) const {
  return files_.pathInStore(movieName(bundleID) + "_trimmed.mp4");
}

}  // namespace qv
