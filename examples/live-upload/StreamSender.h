#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <thread>

#include "../common/AVHandles.h"
#include "Settings.h"

struct AVFormatContext;

namespace upload {

/// Sends packets to a server, and connects anew when the connection is lost.
///
/// Packets wait here for the network, for 2 s at the most; then those of pictures are dropped up to the next key
/// frame: a viewer sees a jump, never an ever later stream. A server that cannot be reached for a minute is given up.
///
/// Threading: thread-safe; one thread of its own does all that may wait for the network.
class StreamSender {
 public:
  enum class State { Connecting, Live, Reconnecting, Failed };
  struct Report {
    State state = State::Connecting;
    uint64_t sentFrames = 0, droppedFrames = 0, connections = 0;
    double latencyMilliseconds = 0;  ///< from `received` to the socket, mean since the last report
    std::string error;               ///< the last one
  };
  struct Parameters {
    CodecParameters video, audio;  ///< packets have times in microseconds
  };

  /// `reported` comes on the sender's thread: at each change of state, and at each key frame sent.
  StreamSender(Settings settings, Parameters parameters, std::function<void(const Report&)> reported);
  ~StreamSender();
  StreamSender(const StreamSender&) = delete;
  StreamSender& operator=(const StreamSender&) = delete;

  /// `received`: when the picture came to this process, on CLOCK_MONOTONIC.
  void sendVideo(Packet packet, std::chrono::nanoseconds received);
  void sendAudio(Packet packet);
  /// Whether pictures were dropped, so that the next one should be a key frame. Says so once.
  [[nodiscard]] bool takeKeyFrameWish() { return keyFrameWanted_.exchange(false); }
  /// Sends what waits, for a few seconds at the most, and ends the stream.
  void finish();

 private:
  using Clock = std::chrono::steady_clock;
  struct Item {
    Packet packet;
    bool isVideo = false;
    std::chrono::nanoseconds received{0};
  };
  void enqueue(Item item);
  void dropBacklog();
  void run();
  [[nodiscard]] bool connect();
  void disconnect(bool isOrderly);
  [[nodiscard]] bool waitBeforeRetry();
  [[nodiscard]] bool sendNext();
  [[nodiscard]] bool write(Item item);
  void report(State state, const std::string& error = {});
  static int isInterrupted(void* sender);

  const Settings settings_;
  const Parameters parameters_;
  const std::function<void(const Report&)> reported_;
  std::atomic<bool> keyFrameWanted_ = false;

  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Item> items_;
  bool isFinishing_ = false, needsKeyFrame_ = true;
  Clock::time_point deadline_ = Clock::time_point::max();  // of the finish
  uint64_t droppedFrames_ = 0;

  // The sender's thread only.
  AVFormatContext* stream_ = nullptr;
  Report report_;
  double latencySum_ = 0;
  int latencyCount_ = 0;
  std::chrono::milliseconds pause_{250};
  Clock::time_point lastLive_ = Clock::now();

  std::thread thread_;  // last: it uses the rest
};

}  // namespace upload
