// The verb recover: movies that a crash cut off.

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>

#include "tools/quorvelctl/ChildOutput.h"
#include "tools/quorvelctl/DaemonStatus.h"
#include "tools/quorvelctl/Verbs.h"
#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;

namespace {

constexpr const char kStore[] = "/private/var/mobile/Library/Quorvel/";
/// In the names that the daemon gives to what it finished, or could not.
constexpr const char kRecovered[] = "_recovered_";
constexpr size_t kTextsOfMovie = 4;

std::string storeDirectory() {
  const char* root = std::getenv("QUORVEL_DEVICE_ROOT");
  return (root != nullptr ? root : "") + std::string(kStore);
}

/// Beside the daemon's modules, where this program is installed or built.
std::string salvageProgram() {
  std::error_code error;
  const auto self = std::filesystem::read_symlink("/proc/self/exe", error);
  return (self.parent_path() / "../lib/quorveld/quorveld-salvage").lexically_normal().string();
}

/// What quorveld-salvage says of these movies; of all without names.
std::vector<json> salvage(const std::vector<std::string>& names) {
  const std::vector<std::string> texts = textsOf(salvageProgram(), names);
  std::vector<json> movies;
  for (size_t at = 0; at + kTextsOfMovie <= texts.size(); at += kTextsOfMovie) {
    json movie{{"name", texts[at]}, {"state", texts[at + 1]}};
    if (!texts[at + 2].empty()) movie["seconds"] = std::strtod(texts[at + 2].c_str(), nullptr);
    if (!texts[at + 3].empty()) movie["error"] = texts[at + 3];
    if (texts[at].empty()) {
      const bool isThere = ::access(storeDirectory().c_str(), R_OK | X_OK) == 0;
      if (!isThere && errno == ENOENT) return {};  // no daemon was ever here
      const bool isHidden = !isThere && errno == EACCES;
      throw Failure{Exit::Failed, "the store cannot be read: " + printable(texts[at + 3]) +
                                      (isHidden ? "; it is the daemon's: use sudo" : "")};
    }
    movies.push_back(std::move(movie));
  }
  return movies;
}

bool isBroken(const json& movie) {
  return movie["state"] == "unfinished" || movie["state"] == "damaged" || movie["state"] == "unreadable";
}

bool wasCutOff(const json& movie) {
  return isBroken(movie) || movie["state"] == "recovered" || movie["state"] == "mended" || movie["state"] == "removed";
}

/// A daemon that runs has finished what it could when it started. What it could not has such a name, and is nobody's;
/// any other movie may be one that it is about to record, or that its application is about to save.
bool isFree(const json& movie, bool hasDaemon) {
  return !hasDaemon || movie["name"].get<std::string>().find(kRecovered) != std::string::npos;
}

std::string lineOf(const json& movie) {
  const std::string name = printable(movie.value("name", "?"));
  const std::string state = movie.value("state", "?");
  std::error_code error;
  const auto size = std::filesystem::file_size(storeDirectory() + movie.value("name", ""), error);
  std::string line = state + "  " + name;
  if (!error) line += "  " + sizeText(size);
  if (movie.contains("seconds")) line += "  " + clockText(movie["seconds"].get<double>());
  if (movie.contains("error")) line += "  (" + printable(movie["error"].get<std::string>()) + ")";
  if (state == "removed") line += "  (no picture was ever written into it)";
  return line;
}

}  // namespace

/// As the daemon does it at its start. Where one is started by its socket, asking whether it runs makes it do so.
Exit recover(const Stage& stage) {
  const bool hasDaemon = whyUnreachable().empty();
  std::vector<json> movies = salvage({});
  std::erase_if(movies, [](const json& movie) { return !wasCutOff(movie); });
  if (!stage.arguments.look) {
    for (json& movie : movies) {
      if (isBroken(movie) && isFree(movie, hasDaemon)) movie = salvage({movie["name"].get<std::string>()}).at(0);
    }
  }
  if (stage.arguments.json) {
    stage.output.json({{"store", storeDirectory()}, {"movies", movies}});
  } else {
    for (const json& movie : movies) stage.output.line(lineOf(movie));
    stage.output.line(movies.empty() ? "no movie was cut off by a crash"
                                     : "they are in " + storeDirectory() + " until they are a day old");
  }
  return std::ranges::none_of(movies, isBroken) ? Exit::Success : Exit::Failed;
}

}  // namespace ctl
