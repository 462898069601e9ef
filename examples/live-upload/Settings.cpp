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
  settings.reconnectTimeout =
      static_cast<int>(numberIn(userInfo, "reconnectTimeout", settings.reconnectTimeout, 1, 3600));
  return settings;
}

const char* Settings::format() const {
  const std::string protocol = scheme();
  if (protocol == "rtmp" || protocol == "rtmps") return "flv";
  if (protocol == "srt" || protocol == "udp" || protocol == "tcp") return "mpegts";
  return nullptr;
}

}  // namespace upload
