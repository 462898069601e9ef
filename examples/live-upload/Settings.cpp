#include "Settings.h"

#include "../common/UserInfo.h"

namespace upload {

Settings Settings::fromUserInfo(const quorvel::Dictionary& userInfo) {
  Settings settings;
  settings.url = textIn(userInfo, "url");
  settings.playbackURL = textIn(userInfo, "playbackURL");
  settings.frameRate = static_cast<int>(numberIn(userInfo, "frameRate", settings.frameRate, 1, 120));
  settings.videoBitRate = static_cast<int>(numberIn(userInfo, "videoBitRate", 0, 50'000, 100'000'000));
  settings.audioBitRate = static_cast<int>(numberIn(userInfo, "audioBitRate", settings.audioBitRate, 32'000, 320'000));
  settings.keyFrameInterval = numberIn(userInfo, "keyFrameInterval", settings.keyFrameInterval, 0.25, 30);
  return settings;
}

const char* Settings::format() const {
  const std::string scheme = url.substr(0, url.find("://"));
  if (scheme == "rtmp" || scheme == "rtmps") return "flv";
  if (scheme == "srt" || scheme == "udp" || scheme == "tcp") return "mpegts";
  return nullptr;
}

}  // namespace upload
