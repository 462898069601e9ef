#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

#include "tools/quorvelctl/MetricsPlot.h"
#include "tools/quorvelctl/Verbs.h"
#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;

namespace {

constexpr const char kFile[] = "/private/var/mobile/Library/Logs/Quorvel/metrics.jsonl";
/// The oldest first.
constexpr const char* kAges[] = {".4", ".3", ".2", ".1", ""};

/// One event of each recording, the oldest first. A line that is none is left out.
json readEvents(const std::string& path) {
  json events = json::array();
  for (const char* age : kAges) {
    errno = 0;
    std::ifstream file(path + age);
    if (!file && errno != ENOENT) {
      const char* advice = errno == EACCES ? "; it is the daemon's: use sudo" : "";
      throw Failure{Exit::Failed, path + age + " cannot be read: " + std::strerror(errno) + advice};
    }
    for (std::string line; std::getline(file, line);) {
      auto event = json::parse(line, nullptr, false);
      if (event.is_object() && event.value("payload", json()).is_object()) events.push_back(std::move(event));
    }
  }
  return events;
}

std::string number(const json& payload, const char* key) {
  const json value = payload.value(key, json(0));
  return value.is_number() ? std::to_string(value.get<int64_t>()) : "?";
}

std::string rowOf(const json& event) {
  const json& payload = event["payload"];
  const int64_t seconds = payload.value("ActiveDuration", int64_t{0}),
                pictures = payload.value("VideoFrameCount", int64_t{0});
  const int64_t reason = payload.value("EndReason", int64_t{0});
  const std::string rate = seconds > 0 ? std::to_string(pictures / seconds) : "-";
  return dateText(event.value("time", 0.0)) + "  " + printable(event.value("serviceName", "?")) + "  " +
         clockText(static_cast<double>(seconds)) + "  " + number(payload, "VideoCaptureWidth") + "x" +
         number(payload, "VideoCaptureHeight") + "  " + rate + " of " + number(payload, "VideoCaptureRate") +
         " pictures/s  " + sizeText(payload.value("RecordedFileSize", uint64_t{0})) + "  " +
         (event.contains("droppedPictures") ? number(event, "droppedPictures") + " dropped  " : "") +
         (reason == 0 ? "stopped" : "error " + std::to_string(reason));
}

[[noreturn]] void cannotWrite(const std::string& path) {
  throw Failure{Exit::NotWritable, path + " cannot be written: " + std::strerror(errno)};
}

/// Whole or not at all, and in place of a former one. What is no plain file (a pipe, /dev/stdout) is written as it is.
void writeFile(const std::string& path, const std::string& content) {
  std::error_code error;
  const bool isSpecial = std::filesystem::exists(path, error) && !std::filesystem::is_regular_file(path, error);
  const std::string written = isSpecial ? path : path + ".part";
  std::ofstream file(written);
  file << content << std::flush;
  if (!file) {
    const int failure = errno;
    if (!isSpecial) std::filesystem::remove(written, error);
    errno = failure;
    cannotWrite(path);
  }
  if (!isSpecial && std::rename(written.c_str(), path.c_str()) != 0) cannotWrite(path);
}

}  // namespace

/// From the file itself: also what a daemon that does not run any more has left.
Exit showMetrics(const Stage& stage) {
  const char* root = std::getenv("QUORVEL_DEVICE_ROOT");
  json events = readEvents((root != nullptr ? root : "") + std::string(kFile));
  if (stage.arguments.plot) writeFile(*stage.arguments.plot, plotOf(events));
  if (stage.arguments.json) {
    stage.output.json({{"events", std::move(events)}});
    return Exit::Success;
  }
  if (stage.arguments.plot) {
    stage.output.line("drawn " + *stage.arguments.plot + ": " + std::to_string(events.size()) + " recordings");
    return Exit::Success;
  }
  if (events.empty()) stage.output.line("nothing was recorded yet");
  for (const json& event : events) stage.output.line(rowOf(event));
  return Exit::Success;
}

}  // namespace ctl
