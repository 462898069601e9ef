#include <cinttypes>
#include <cstdio>
#include <string>

#include "Game.h"

namespace comet {

namespace {

/// Of our Info.json.
constexpr const char kBundleID[] = "com.example.quorvel.game";

std::string textOf(const quorvel::Value& value) {
  if (const auto* text = std::get_if<std::string>(&value.content)) return *text;
  if (const auto* integer = std::get_if<int64_t>(&value.content)) return std::to_string(*integer);
  if (const auto* number = std::get_if<double>(&value.content)) return std::to_string(*number);
  return "...";
}

}  // namespace

/// The daemon keeps the set-up, but a start that failed may have been for the want of it: so it is made anew each time.
void Game::setUpBroadcast() {
  quorvel::BroadcastOptions options;
  options.hostBundleID = kBundleID;
  options.extensionBundleID = options_.broadcast;
  options.configuration = quorvel::archivedConfiguration({.clipDuration = options_.clipDuration});
  for (const auto& [key, text] : options_.broadcastInfo) options.userInfo[key] = {text};
  recorder_->setupBroadcast(std::move(options), [this](const std::optional<quorvel::Error>& error) {
    if (!error) return startRecording();
    report(*error);
    failScript();
  });
}

void Game::listenToBroadcast(quorvel::Events& events) {
  events.broadcastURLChanged = [this](const std::string& url) {
    std::printf("broadcast url=%s\n", url.c_str());
    recorder_->setBroadcastURL(url);
  };
  events.broadcastServiceInfoChanged = [](const quorvel::Dictionary& info) {
    std::printf("service");
    for (const auto& [key, value] : info) std::printf(" %s=\"%s\"", key.c_str(), textOf(value).c_str());
    std::printf("\n");
  };
}

}  // namespace comet
