#include "StreamSender.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace upload {

namespace {

using namespace std::chrono_literals;

constexpr int64_t kLongestBacklog = 2'000'000;  // microseconds of stream
constexpr std::chrono::milliseconds kFirstPause = 250ms, kLongestPause = 8s;
constexpr auto kHolding = 3s;  // from then on a connection is not one that the server drops at once
/// Somebody waits for the stream to begin, and the URL may be wrong.
constexpr std::chrono::seconds kLongestFirstTry = 20s;
constexpr auto kLongestFinish = 3s;

}  // namespace

StreamSender::StreamSender(Settings settings, StreamParameters parameters, std::function<void(const Report&)> reported)
    : settings_(std::move(settings)),
      parameters_(std::move(parameters)),
      reported_(std::move(reported)),
      thread_([this] { run(); }) {}

StreamSender::~StreamSender() {
  {
    std::lock_guard lock(mutex_);
    isFinishing_ = true;
    deadline_ = std::min(deadline_, Clock::now());
  }
  changed_.notify_all();
  if (thread_.joinable()) thread_.join();
}

void StreamSender::finish() {
  {
    std::lock_guard lock(mutex_);
    isFinishing_ = true;
    deadline_ = Clock::now() + kLongestFinish;
  }
  changed_.notify_all();
  thread_.join();
}

// The queue -------------------------------------------------------------------------------------------

void StreamSender::sendVideo(Packet packet, std::chrono::nanoseconds received) {
  enqueue({std::move(packet), true, received});
}

void StreamSender::sendAudio(Packet packet) { enqueue({std::move(packet)}); }

void StreamSender::enqueue(Item item) {
  {
    std::lock_guard lock(mutex_);
    if (isFinishing_) return;
    const bool isKey = (item.packet->flags & AV_PKT_FLAG_KEY) != 0;
    if (item.isVideo && needsKeyFrame_) {
      if (!isKey) {
        ++droppedFrames_;
        return;
      }
      needsKeyFrame_ = false;
    }
    items_.push_back(std::move(item));
    if (items_.back().packet->dts - items_.front().packet->dts > kLongestBacklog) dropBacklog();
  }
  changed_.notify_all();
}

/// The mutex is held. Nothing of what waits would come in time.
void StreamSender::dropBacklog() {
  droppedFrames_ +=
      static_cast<uint64_t>(std::count_if(items_.begin(), items_.end(), [](auto& i) { return i.isVideo; }));
  items_.clear();
  needsKeyFrame_ = true;
  keyFrameWanted_ = true;
}

// The thread ------------------------------------------------------------------------------------------

void StreamSender::run() {
  report(State::Connecting);
  do {
    if (connect()) {
      while (sendNext()) {
      }
    }
  } while (waitBeforeRetry());
  if (connection_) connection_->finish();
  connection_.reset();
}

bool StreamSender::isPastEnd() {
  std::lock_guard lock(mutex_);
  return Clock::now() >= deadline_;
}

bool StreamSender::connect() {
  connection_ = std::make_unique<StreamConnection>(settings_, parameters_, [this] { return isPastEnd(); });
  if (auto failure = connection_->open()) {
    failure_ = std::move(*failure);
    connection_.reset();
    return false;
  }
  connectedAt_ = Clock::now();
  if (++report_.connections > 1) {
    // What was cut with the former connection cannot be decoded from its middle.
    std::lock_guard lock(mutex_);
    dropBacklog();
  }
  failure_ = {};
  report(State::Live);
  return true;
}

/// False where nothing more is to be tried; then there is a connection only if it works.
bool StreamSender::waitBeforeRetry() {
  std::unique_lock lock(mutex_);
  if (isFinishing_) return false;
  lock.unlock();
  const std::chrono::seconds patience(settings_.reconnectTimeout);
  const auto left = lastHeld_ + (hasHeld_ ? patience : std::min(patience, kLongestFirstTry)) - Clock::now();
  if (left <= 0s || (failure_.isDefinite && !hasHeld_)) {
    report(State::Failed);
    return false;
  }
  report(report_.connections > 0 ? State::Reconnecting : State::Connecting);
  lock.lock();
  changed_.wait_for(lock, std::min<Clock::duration>(pause_, left), [this] { return isFinishing_; });
  pause_ = std::min(pause_ * 2, kLongestPause);
  return !isFinishing_;
}

/// False where the connection is lost, or all was sent that there will be.
bool StreamSender::sendNext() {
  Item item;
  {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [this] { return isFinishing_ || !items_.empty(); });
    if (items_.empty() || Clock::now() >= deadline_) return false;
    item = std::move(items_.front());
    items_.pop_front();
  }
  return write(std::move(item));
}

bool StreamSender::write(Item item) {
  const bool isKey = item.isVideo && (item.packet->flags & AV_PKT_FLAG_KEY) != 0;
  const auto stream = item.isVideo ? StreamConnection::kVideo : StreamConnection::kAudio;
  if (auto failure = connection_->write(std::move(item.packet), stream)) {
    failure_ = std::move(*failure);
    connection_.reset();
    std::lock_guard lock(mutex_);
    if (item.isVideo) ++droppedFrames_;
    return false;
  }
  noteSent(item);
  if (isKey) report(State::Live);
  return true;
}

void StreamSender::noteSent(const Item& item) {
  const auto now = Clock::now();
  if (now - connectedAt_ >= kHolding) {
    hasHeld_ = true;
    lastHeld_ = now;
    pause_ = kFirstPause;
  }
  if (!item.isVideo) return;
  ++report_.sentFrames;
  latencySum_ += std::chrono::duration<double, std::milli>(now.time_since_epoch() - item.received).count();
  ++latencyCount_;
}

void StreamSender::report(State state) {
  const bool isNew = report_.state != state || report_.error != failure_.text;
  report_.state = state;
  report_.error = failure_.text;
  if (latencyCount_ > 0) report_.latencyMilliseconds = latencySum_ / latencyCount_;
  latencySum_ = latencyCount_ = 0;
  {
    std::lock_guard lock(mutex_);
    report_.droppedFrames = droppedFrames_;
  }
  if (isNew)
    std::fprintf(stderr, "live-upload: %s, connection %llu, %llu pictures sent, %llu dropped%s%s\n", nameOf(state),
                 static_cast<unsigned long long>(report_.connections),
                 static_cast<unsigned long long>(report_.sentFrames),
                 static_cast<unsigned long long>(report_.droppedFrames), failure_.text.empty() ? "" : ": ",
                 failure_.text.c_str());
  reported_(report_);
}

const char* nameOf(StreamSender::State state) {
  switch (state) {
    case StreamSender::State::Connecting:
      return "connecting";
    case StreamSender::State::Live:
      return "live";
    case StreamSender::State::Reconnecting:
      return "reconnecting";
    case StreamSender::State::Failed:
      break;
  }
  return "failed";
}

}  // namespace upload
