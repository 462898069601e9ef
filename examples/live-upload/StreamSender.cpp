#include "StreamSender.h"

#include <algorithm>
#include <utility>

#include "PictureEncoder.h"

namespace upload {

namespace {

using namespace std::chrono_literals;

constexpr int64_t kLongestBacklog = 2'000'000;  // microseconds of stream
constexpr auto kFirstPause = 250ms, kLongestPause = 8000ms;
constexpr auto kLongestAbsence = 60s;
constexpr auto kLongestFinish = 3s;
constexpr const char kNetworkTimeout[] = "5000000";  // microseconds
constexpr int64_t kInterleaving = 500'000;           // microseconds

enum Streams { kVideo = 0, kAudio = 1 };

}  // namespace

StreamSender::StreamSender(Settings settings, Parameters parameters, std::function<void(const Report&)> reported)
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
  for (;;) {
    if (connect()) {
      while (sendNext()) {
      }
    }
    {
      std::lock_guard lock(mutex_);
      if (isFinishing_) break;
    }
    if (!waitBeforeRetry()) break;
  }
  disconnect(true);
}

/// False where nothing more is to be tried.
bool StreamSender::waitBeforeRetry() {
  disconnect(false);
  if (Clock::now() - lastLive_ > kLongestAbsence) {
    report(State::Failed, report_.error);
    return false;
  }
  report(report_.connections > 0 ? State::Reconnecting : State::Connecting, report_.error);
  std::unique_lock lock(mutex_);
  changed_.wait_for(lock, pause_, [this] { return isFinishing_; });
  pause_ = std::min(pause_ * 2, std::chrono::milliseconds(kLongestPause));
  return !isFinishing_;
}

int StreamSender::isInterrupted(void* sender) {
  auto& self = *static_cast<StreamSender*>(sender);
  std::lock_guard lock(self.mutex_);
  return Clock::now() >= self.deadline_ ? 1 : 0;
}

bool StreamSender::connect() {
  avformat_alloc_output_context2(&stream_, nullptr, settings_.format(), settings_.url.c_str());
  if (stream_ == nullptr) return false;
  stream_->interrupt_callback = {&StreamSender::isInterrupted, this};
  stream_->max_interleave_delta = kInterleaving;
  stream_->flags |= AVFMT_FLAG_FLUSH_PACKETS;
  for (const auto* codec : {parameters_.video.get(), parameters_.audio.get()}) {
    AVStream* stream = avformat_new_stream(stream_, nullptr);
    if (stream == nullptr || avcodec_parameters_copy(stream->codecpar, codec) < 0) return false;
    stream->time_base = kMicroseconds;
  }
  AVDictionary* options = nullptr;
  av_dict_set(&options, "rw_timeout", kNetworkTimeout, 0);
  av_dict_set(&options, "flvflags", "no_duration_filesize", 0);
  int result = avio_open2(&stream_->pb, settings_.url.c_str(), AVIO_FLAG_WRITE, &stream_->interrupt_callback, &options);
  if (result >= 0) result = avformat_write_header(stream_, &options);
  av_dict_free(&options);
  if (result < 0) {
    report_.error = errorText(result);
    return false;
  }
  ++report_.connections;
  pause_ = kFirstPause;
  {
    // What was cut with the former connection cannot be decoded from its middle.
    std::lock_guard lock(mutex_);
    if (report_.connections > 1) dropBacklog();
  }
  report(State::Live);
  return true;
}

void StreamSender::disconnect(bool isOrderly) {
  if (stream_ == nullptr) return;
  if (isOrderly && report_.state == State::Live) av_write_trailer(stream_);
  avio_closep(&stream_->pb);
  avformat_free_context(stream_);
  stream_ = nullptr;
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
  const int index = item.isVideo ? kVideo : kAudio;
  item.packet->stream_index = index;
  av_packet_rescale_ts(item.packet.get(), kMicroseconds, stream_->streams[index]->time_base);
  const int result = av_interleaved_write_frame(stream_, item.packet.get());
  if (result < 0) {
    std::lock_guard lock(mutex_);
    if (item.isVideo) ++droppedFrames_;
    report_.error = errorText(result);
    return false;
  }
  lastLive_ = Clock::now();
  if (!item.isVideo) return true;
  ++report_.sentFrames;
  latencySum_ += std::chrono::duration<double, std::milli>(lastLive_.time_since_epoch() - item.received).count();
  ++latencyCount_;
  if (isKey) report(State::Live);
  return true;
}

void StreamSender::report(State state, const std::string& error) {
  report_.state = state;
  report_.error = error;
  if (latencyCount_ > 0) report_.latencyMilliseconds = latencySum_ / latencyCount_;
  latencySum_ = latencyCount_ = 0;
  {
    std::lock_guard lock(mutex_);
    report_.droppedFrames = droppedFrames_;
  }
  reported_(report_);
}

}  // namespace upload
