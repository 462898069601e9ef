#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "StreamConnection.h"

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
  /// `reported` comes on the sender's thread: at each change of state, and at each key frame sent.
  StreamSender(Settings settings, StreamParameters parameters, std::function<void(const Report&)> reported);
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
  [[nodiscard]] bool waitBeforeRetry();
  [[nodiscard]] bool sendNext();
  [[nodiscard]] bool write(Item item);
  void noteSent(const Item& item);
  void report(State state);
  [[nodiscard]] bool isPastEnd();

  const Settings settings_;
  const StreamParameters parameters_;
  const std::function<void(const Report&)> reported_;
  std::atomic<bool> keyFrameWanted_ = false;

  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Item> items_;
  bool isFinishing_ = false, needsKeyFrame_ = true;
  Clock::time_point deadline_ = Clock::time_point::max();  // of the finish
  uint64_t droppedFrames_ = 0;

  // The sender's thread only.
  std::unique_ptr<StreamConnection> connection_;  // nothing while there is none
  StreamConnection::Failure failure_;             // the last one
  Report report_;
  double latencySum_ = 0;
  int latencyCount_ = 0;
  bool hasHeld_ = false;  // any connection so far
  std::chrono::milliseconds pause_{250};
  Clock::time_point connectedAt_, lastHeld_ = Clock::now();

  std::thread thread_;  // last: it uses the rest
};

/// As the application is told it.
const char* nameOf(StreamSender::State state);

}  // namespace upload
