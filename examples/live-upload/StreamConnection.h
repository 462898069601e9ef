#pragma once

#include <chrono>
#include <functional>
#include <optional>
#include <string>

#include "../common/AVHandles.h"
#include "Settings.h"

struct AVFormatContext;

namespace upload {

/// What both streams of a connection begin with.
struct StreamParameters {
  CodecParameters video, audio;  ///< packets have times in microseconds
};

/// One connection to the server, and the container that goes over it: FLV or MPEG-TS.
///
/// Every call returns within some seconds, whatever the server does.
///
/// Threading: one thread, which may have to wait for the network.
class StreamConnection {
 public:
  enum Stream { kVideo = 0, kAudio = 1 };
  struct Failure {
    std::string text;  ///< without the URL's query, which may hold a password
    /// It lies in the URL, or the server has said no: the same would come again.
    bool isDefinite = false;
  };

  /// What is given must outlive it. `isCancelled` is asked while a call waits, and ends it.
  StreamConnection(const Settings& settings, const StreamParameters& parameters, std::function<bool()> isCancelled);
  /// Closes at once, without a word to the server; after `finish` that has been said.
  ~StreamConnection();
  StreamConnection(const StreamConnection&) = delete;
  StreamConnection& operator=(const StreamConnection&) = delete;

  /// Connects and sends the container's head, with the codecs' parameter sets. Once, first.
  [[nodiscard]] std::optional<Failure> open();
  [[nodiscard]] std::optional<Failure> write(Packet packet, Stream stream);
  /// Sends what the container still holds back, and its end.
  void finish();

 private:
  using Clock = std::chrono::steady_clock;
  [[nodiscard]] bool addStream(const AVCodecParameters& codec);
  [[nodiscard]] int connect();
  [[nodiscard]] Failure failure(int code, std::string cause) const;
  static int isInterrupted(void* connection);

  const Settings& settings_;
  const StreamParameters& parameters_;
  const std::function<bool()> isCancelled_;
  AVFormatContext* stream_ = nullptr;
  Clock::time_point deadline_ = Clock::time_point::max();  // of the present call
};

}  // namespace upload
