#pragma once

#include <quorvel/Types.h>

#include <string>

namespace upload {

/// What the application chose, by the user information of the broadcast's set-up.
struct Settings {
  std::string url;          ///< "url": where to send to: rtmp, rtmps, srt, udp or tcp
  std::string playbackURL;  ///< "playbackURL": where it can be watched; empty: not told
  int frameRate = 30;       ///< "frameRate": pictures a second at the most
  int videoBitRate = 0;     ///< "videoBitRate": bits a second; 0: by the picture's size
  int audioBitRate = 128'000;
  double keyFrameInterval = 2;  ///< "keyFrameInterval": seconds
  int reconnectTimeout = 60;    ///< "reconnectTimeout": seconds without a connection that holds, until we give up

  static Settings fromUserInfo(const quorvel::Dictionary& userInfo);
  [[nodiscard]] std::string scheme() const { return url.substr(0, url.find("://")); }
  /// The container for the URL's protocol; nothing for a protocol that we do not send over.
  [[nodiscard]] const char* format() const;
};

}  // namespace upload
