#include "platform/mp4/MovieRecorder.h"

#include <pthread.h>

#include <algorithm>
#include <utility>

namespace qv::platform::mp4 {

MovieRecorder::MovieRecorder(std::unique_ptr<MovieFile> file, std::vector<MovieTrack> tracks,
                             std::function<void(const Error&)> onFailure)
    : writer_(std::move(file), tracks, MovieWriter::Layout::Fragmented),
      tracks_(std::move(tracks)),
      onFailure_(std::move(onFailure)),
      pending_(tracks_.size()),
      thread_([this] { run(); }) {
  pthread_setname_np(thread_.native_handle(), "qv-movie-file");
}

MovieRecorder::~MovieRecorder() {
  {
    std::lock_guard lock(mutex_);
    stopping_ = true;
  }
  changed_.notify_one();
  thread_.join();
}

void MovieRecorder::append(size_t track, EncodedSample sample) {
  {
    std::unique_lock lock(mutex_);
    room_.wait(lock, [this] { return queuedBytes_ < kMaximumQueuedBytes || failed_; });
    if (failed_) return;
    queuedBytes_ += sample.data.size();
    queue_.push_back({track, std::move(sample)});
    if (isGathering_ && !isCrowded()) return;
  }
  changed_.notify_one();
}

void MovieRecorder::finish(const MovieEnd& end, std::function<void(std::optional<Error>)> completion) {
  {
    std::lock_guard lock(mutex_);
    finish_ = Finish{end, std::move(completion)};
  }
  changed_.notify_one();
}

void MovieRecorder::run() {
  if (auto error = writer_.writeHeader()) fail(*error);
  for (;;) {
    Work work = waitForWork();
    room_.notify_all();
    take(std::move(work.items));
    if (work.finish || work.isLast) flush();
    if (work.finish) {
      if (!error_) error_ = writer_.finish(work.finish->end);
      const auto lost = writer_.close();
      if (!error_) error_ = lost;
      work.finish->completion(error_);
    }
    if (work.isLast) return;
  }
}

MovieRecorder::Work MovieRecorder::waitForWork() {
  std::unique_lock lock(mutex_);
  const auto isDue = [this] { return !queue_.empty() || finish_ || stopping_; };
  hasPending() ? (void)changed_.wait_until(lock, pendingSince_ + kFragmentLength, isDue) : changed_.wait(lock, isDue);
  gather(lock);
  queuedBytes_ = 0;
  return {std::exchange(queue_, {}), std::exchange(finish_, std::nullopt), stopping_};
}

/// Nothing is written until a fragment is full, so nothing is gained by waking up for each sample.
void MovieRecorder::gather(std::unique_lock<std::mutex>& lock) {
  isGathering_ = true;
  changed_.wait_for(lock, kGathering, [this] { return isCrowded() || finish_ || stopping_; });
  isGathering_ = false;
}

void MovieRecorder::take(std::vector<Item> items) {
  for (Item& item : items) add(std::move(item));
  if (hasPending() && std::chrono::steady_clock::now() >= pendingSince_ + kFragmentLength) flush();
}

void MovieRecorder::add(Item item) {
  const auto& mine = pending_[item.track];
  const int64_t fragmentTicks = kFragmentLength.count() * int64_t{tracks_[item.track].timescale} / 1000;
  if (!mine.empty() && item.sample.decodeTime - mine.front().decodeTime >= fragmentTicks) {
    // Here, with the next sample in hand, the duration of the last one is known.
    pending_[item.track].back().duration = static_cast<uint32_t>(item.sample.decodeTime - mine.back().decodeTime);
    flush();
  }
  if (!hasPending()) pendingSince_ = std::chrono::steady_clock::now();
  pending_[item.track].push_back(std::move(item.sample));
}

void MovieRecorder::flush() {
  if (!error_) {
    if (auto error = writer_.writeFragment(pending_)) fail(*error);
  }
  for (auto& samples : pending_) samples.clear();
}

void MovieRecorder::fail(const Error& error) {
  error_ = error;
  (void)writer_.finish({});  // without room for the index the file stays a file of fragments
  {
    std::lock_guard lock(mutex_);
    failed_ = true;
  }
  room_.notify_all();
  onFailure_(error);
}

bool MovieRecorder::hasPending() const {
  return std::any_of(pending_.begin(), pending_.end(), [](const auto& samples) { return !samples.empty(); });
}

}  // namespace qv::platform::mp4
