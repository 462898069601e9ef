#pragma once

#include <quorvel/BroadcastExtension.h>

#include <memory>
#include <string>

#include "HTTPUploader.h"
#include "Playlist.h"
#include "TransportStream.h"

namespace upload {

/// Puts each clip on an HTTP server as a segment of an HLS stream, and the playlist after it. The last clip ends the
/// playlist; so does the end of the process in a broadcast that breaks off.
///
/// User information: "url", the directory to put files into (http or https); "name", of the playlist; "clipDuration",
/// seconds; "authorization", that header's value.
class ClipUpload final : public quorvel::ClipExtension {
 public:
  ~ClipUpload() override;
  void processClip(quorvel::Clip clip, quorvel::ClipCompletion done) override;

 private:
  /// One stream.
  struct Show {
    explicit Show(const quorvel::Dictionary& userInfo);
    std::string directory, name;
    double clipDuration;  // 0: as the daemon does
    HTTPUploader uploader;
    Playlist playlist;
    TransportStream stream;
    int lastIndex = 0, sent = 0, failed = 0;
    std::string error;
  };
  void putClip(const quorvel::Clip& clip);
  void putPlaylist();
  void fail(const std::string& error);
  void end();
  [[nodiscard]] quorvel::Dictionary serviceInfo(bool isLast) const;

  std::unique_ptr<Show> show_;
};

}  // namespace upload
