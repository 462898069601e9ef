#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>
#include <vector>

#include "platform/mp4/MovieWriter.h"

namespace qv::platform::mp4 {

/// Writes a movie from a thread of its own, in fragments of `kFragmentLength`: by the samples' times,
/// and by the clock when few come. No track waits for another. The disk never holds up the encoder until
/// `kMaximumQueuedBytes` wait for it.
///
/// When the disk fails, what was written before is finished at once and `onFailure` is told; later
/// samples are dropped.
///
/// Threading: `append` and `finish` from one thread at a time; callbacks come on the file's thread.
class MovieRecorder {
 public:
  static constexpr size_t kMaximumQueuedBytes = 32u << 20;
  /// A crash may cost a second. What stands in the encoder is lost beside the fragment, so that leaves
  /// it 200 ms (measured: 63 ms at most in 40 recordings at 60 frames/s on two busy cores).
  static constexpr std::chrono::milliseconds kFragmentLength{800};
  /// How long the thread lets samples gather before it looks at them.
  static constexpr std::chrono::milliseconds kGathering{50};

  MovieRecorder(std::unique_ptr<MovieFile> file, std::vector<MovieTrack> tracks,
                std::function<void(const Error&)> onFailure);
  /// Without a finish: writes what is queued and leaves the file as a crash would, so playable.
  ~MovieRecorder();
  MovieRecorder(const MovieRecorder&) = delete;
  MovieRecorder& operator=(const MovieRecorder&) = delete;

  /// Blocks while the queue is full.
  void append(size_t track, EncodedSample sample);
  /// Once. `completion` gets the first error that there was; the file is closed by then.
  void finish(const MovieEnd& end, std::function<void(std::optional<Error>)> completion);

 private:
  struct Item {
    size_t track;
    EncodedSample sample;
  };
  struct Finish {
    MovieEnd end;
    std::function<void(std::optional<Error>)> completion;
  };
  /// What came since the last time; all of it where `isLast`.
  struct Work {
    std::vector<Item> items;
    std::optional<Finish> finish;
    bool isLast;
  };
  void run();
  Work waitForWork();
  void gather(std::unique_lock<std::mutex>& lock);
  void take(std::vector<Item> items);
  void add(Item item);
  void flush();
  void fail(const Error& error);
  [[nodiscard]] bool hasPending() const;
  [[nodiscard]] bool isCrowded() const { return queuedBytes_ > kMaximumQueuedBytes / 8; }

  // Of the file's thread.
  MovieWriter writer_;
  const std::vector<MovieTrack> tracks_;
  const std::function<void(const Error&)> onFailure_;
  std::vector<std::vector<EncodedSample>> pending_;
  std::chrono::steady_clock::time_point pendingSince_;
  std::optional<Error> error_;

  std::mutex mutex_;
  std::condition_variable changed_;
  std::condition_variable room_;
  std::vector<Item> queue_;
  size_t queuedBytes_ = 0;
  bool isGathering_ = false;
  bool failed_ = false;
  bool stopping_ = false;
  std::optional<Finish> finish_;
  std::thread thread_;
};

}  // namespace qv::platform::mp4
