#include "tools/quorvelctl/RecordingText.h"

#include <ctime>

#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;

namespace {

std::string headOf(const json& recording) {
  const std::string state = recording.value("state", "");
  const std::string word = state == "running" ? "recording" : state;
  if (recording.contains("seconds")) return word + " " + clockText(recording["seconds"].get<double>());
  if (!recording.contains("since")) return word;
  return word + " " + clockText(static_cast<double>(std::time(nullptr)) - recording["since"].get<double>());
}

std::string whatOf(const json& recording) {
  const std::string of = recording.value("systemRecording", false) ? "the screen" : "an application";
  return recording.value("kind", "movie") + " of " + of;
}

}  // namespace

std::vector<std::string> partsOf(const json& recording) {
  std::vector<std::string> parts{headOf(recording)};
  if (recording.contains("bytes")) parts.push_back(sizeText(recording["bytes"].get<uint64_t>()));
  if (recording.contains("droppedPictures")) parts.push_back(recording["droppedPictures"].dump() + " dropped");
  if (recording.contains("pictures")) parts.push_back(recording["pictures"].dump() + " pictures");
  parts.push_back(whatOf(recording));
  if (recording.contains("bundleIdentifier")) {
    parts.push_back("by " + printable(recording["bundleIdentifier"].get<std::string>()));
  }
  if (recording.contains("videoEncoder")) parts.push_back(printable(recording["videoEncoder"].get<std::string>()));
  if (recording.value("microphoneEnabled", false)) parts.emplace_back("microphone on");
  return parts;
}

std::string lineOf(const json& recordings, size_t characters) {
  if (recordings.empty()) return cutTo("nothing is recorded", characters);
  std::vector<std::string> parts;
  for (const json& recording : recordings) {
    const auto more = partsOf(recording);
    parts.insert(parts.end(), more.begin(), more.end());
  }
  return fitted(parts, characters);
}

}  // namespace ctl
