#include "platform/sound/PacedTapQueue.h"

#include <algorithm>
#include <atomic>
#include <cstring>
#include <deque>
#include <mutex>

namespace qv::platform {
namespace {

constexpr uint32_t kEarlyFrames = 1024;
constexpr size_t kBuffersForEarlyHandOver = 6;
constexpr uint32_t kMaximumBufferSize = 1 << 20;

struct OwnedBuffer {
  explicit OwnedBuffer(uint32_t byteSize) : bytes(byteSize), buffer{byteSize, bytes.data(), 0} {}
  std::vector<uint8_t> bytes;
  QueueBuffer buffer;
};

/// What the queue and its thread share.
///
/// Threading: `mutex` guards all but the constants; callbacks run outside it.
struct Tap {
  Tap(const PCMFormat& f, AppAudioInputCallback c) : format(f), callback(std::move(c)) {}

  uint64_t beginRun();
  void setRunning(uint64_t ofRun, bool now);
  void setNotRunning();
  void take(uint64_t ofRun, const PCMBlock& block);
  void handOverRest(uint64_t ofRun);
  void handOverFront(std::unique_lock<std::mutex>& lock);
  bool fill(const PCMBlock& block, size_t& offset);

  const PCMFormat format;
  const AppAudioInputCallback callback;
  std::mutex mutex;
  std::vector<std::unique_ptr<OwnedBuffer>> buffers;
  std::deque<QueueBuffer*> enqueued;  // the front is being filled
  AudioTimeStamp frontStart;
  double nextSampleTime = 0;  // that continues the front buffer
  std::function<void()> listener;
  uint64_t run = 0;  // counts the starts: a thread that winds down must not touch the next run
  bool running = false;
};

/// With the lock held.
uint64_t Tap::beginRun() {
  for (QueueBuffer* buffer : enqueued) buffer->byteSize = 0;
  return ++run;
}

void Tap::setNotRunning() {
  std::unique_lock lock(mutex);
  const uint64_t current = run;
  lock.unlock();
  setRunning(current, false);
}

void Tap::setRunning(uint64_t ofRun, bool now) {
  std::unique_lock lock(mutex);
  if (run != ofRun || running == now) return;
  running = now;
  const auto call = listener;
  lock.unlock();
  if (call) call();
}

/// Copies what the front buffer can hold, and tells whether it is to be handed over.
bool Tap::fill(const PCMBlock& block, size_t& offset) {
  QueueBuffer& front = *enqueued.front();
  const size_t frameSize = format.bytesPerFrame();
  const size_t skipped = offset / frameSize;
  const double sampleTime = static_cast<double>(block.sampleTime) + static_cast<double>(skipped);
  if (front.byteSize > 0 && sampleTime != nextSampleTime) return true;
  if (front.byteSize == 0) {
    frontStart = {};
    frontStart.sampleTime = sampleTime;
    frontStart.hostTime = block.hostTime + skipped * 1'000'000'000 / format.sampleRate;
    frontStart.rateScalar = 1;
  }
  const size_t room = (front.capacity - front.byteSize) / frameSize * frameSize;
  const size_t bytes = std::min(room, block.bytes.size() - offset);
  std::memcpy(front.data + front.byteSize, block.bytes.data() + offset, bytes);
  front.byteSize += static_cast<uint32_t>(bytes);
  offset += bytes;
  const size_t frames = bytes / frameSize;
  nextSampleTime = sampleTime + static_cast<double>(frames);
  const bool full = front.capacity - front.byteSize < frameSize;
  return full || (front.byteSize >= kEarlyFrames * frameSize && enqueued.size() >= kBuffersForEarlyHandOver);
}

void Tap::take(uint64_t ofRun, const PCMBlock& block) {
  size_t offset = 0;
  while (offset < block.bytes.size()) {
    std::unique_lock lock(mutex);
    if (run != ofRun || !running || enqueued.empty()) return;
    if (fill(block, offset)) handOverFront(lock);
  }
}

void Tap::handOverRest(uint64_t ofRun) {
  std::unique_lock lock(mutex);
  if (run != ofRun || !running || enqueued.empty() || enqueued.front()->byteSize == 0) return;
  handOverFront(lock);
}

/// Releases the lock.
void Tap::handOverFront(std::unique_lock<std::mutex>& lock) {
  QueueBuffer* filled = enqueued.front();
  enqueued.pop_front();
  const AudioTimeStamp start = frontStart;
  lock.unlock();
  callback(filled, start, filled->byteSize / format.bytesPerFrame());
}

/// Threading: as AppAudioTapQueue.
class PacedTapQueue final : public AppAudioTapQueue {
 public:
  PacedTapQueue(const PCMFormat& format, AppAudioInputCallback callback, const TapSourceFactory& factory,
                PacedClock& clock)
      : factory_(factory), clock_(clock), tap_(std::make_shared<Tap>(format, std::move(callback))) {}
  ~PacedTapQueue() override { dispose(); }

  int32_t setTappedProcess(int32_t processID) override {
    if (disposed_) return kTapDisposed;
    if (processID < 1) return kTapNoProcess;
    process_ = processID;
    return 0;
  }
  int32_t streamDescription(AudioStreamDescription& description) override {
    description = tap_->format.description();
    return 0;
  }
  int32_t maximumOutputPacketSize(uint32_t& bytes) override {
    bytes = tap_->format.bytesPerFrame();
    return 0;
  }
  int32_t allocateBuffer(uint32_t byteSize, QueueBuffer*& buffer) override;
  int32_t enqueueBuffer(QueueBuffer* buffer) override;
  int32_t addIsRunningListener(std::function<void()> listener) override {
    std::lock_guard lock(tap_->mutex);
    tap_->listener = std::move(listener);
    return 0;
  }
  int32_t removeIsRunningListener() override {
    std::lock_guard lock(tap_->mutex);
    tap_->listener = nullptr;
    return 0;
  }
  int32_t start() override;
  int32_t stop() override;
  int32_t freeBuffer(QueueBuffer* buffer) override;
  int32_t dispose() override;

 private:
  const TapSourceFactory factory_;
  PacedClock& clock_;
  const std::shared_ptr<Tap> tap_;
  /// A callback may enqueue, stop or dispose while the owner does, so what they share is locked.
  std::shared_ptr<PCMPacer> currentPacer() {
    std::lock_guard lock(tap_->mutex);
    return pacer_;
  }

  void end(void (PCMPacer::*how)(), PCMPacer& pacer);

  std::shared_ptr<PCMPacer> pacer_;  // stopped but kept after a stop from a callback
  int32_t process_ = 0;
  std::atomic<bool> disposed_ = false;
};

auto find(Tap& tap, const QueueBuffer* buffer) {
  return std::find_if(tap.buffers.begin(), tap.buffers.end(),
                      [&](const auto& owned) { return &owned->buffer == buffer; });
}

int32_t PacedTapQueue::allocateBuffer(uint32_t byteSize, QueueBuffer*& buffer) {
  if (disposed_) return kTapDisposed;
  if (byteSize < tap_->format.bytesPerFrame() || byteSize > kMaximumBufferSize) return kTapBadSize;
  auto owned = std::make_unique<OwnedBuffer>(byteSize);
  buffer = &owned->buffer;
  std::lock_guard lock(tap_->mutex);
  tap_->buffers.push_back(std::move(owned));
  return 0;
}

int32_t PacedTapQueue::enqueueBuffer(QueueBuffer* buffer) {
  if (disposed_) return kTapDisposed;
  std::lock_guard lock(tap_->mutex);
  auto& enqueued = tap_->enqueued;
  if (find(*tap_, buffer) == tap_->buffers.end()) return kTapNoSuchBuffer;
  if (std::find(enqueued.begin(), enqueued.end(), buffer) != enqueued.end()) return kTapNoSuchBuffer;
  buffer->byteSize = 0;
  enqueued.push_back(buffer);
  return 0;
}

int32_t PacedTapQueue::freeBuffer(QueueBuffer* buffer) {
  std::lock_guard lock(tap_->mutex);
  const auto owned = find(*tap_, buffer);
  if (owned == tap_->buffers.end()) return kTapNoSuchBuffer;
  std::erase(tap_->enqueued, buffer);
  tap_->buffers.erase(owned);
  return 0;
}

int32_t PacedTapQueue::start() {
  if (disposed_) return kTapDisposed;
  if (process_ < 1) return kTapNoProcess;
  const auto former = currentPacer();  // ends after the lock below
  if (former && !former->isStopped()) return 0;
  auto source = factory_(process_, tap_->format);
  if (!source) return kTapNotAvailable;
  // The thread's first act is to take this lock: a callback finds the pacer in its place.
  std::lock_guard lock(tap_->mutex);
  const uint64_t run = tap_->beginRun();
  PCMPacer::Callbacks callbacks{.opened = [tap = tap_, run] { tap->setRunning(run, true); },
                                .sink = [tap = tap_, run](const PCMBlock& block) { tap->take(run, block); },
                                .completed = [tap = tap_, run] { tap->handOverRest(run); },
                                .closed = [tap = tap_, run] { tap->setRunning(run, false); }};
  pacer_ = std::make_shared<PCMPacer>(tap_->format, std::move(source), std::move(callbacks), clock_);
  return 0;
}

int32_t PacedTapQueue::stop() {
  if (const auto pacer = currentPacer()) end(&PCMPacer::stop, *pacer);
  return 0;
}

void PacedTapQueue::end(void (PCMPacer::*how)(), PCMPacer& pacer) {
  (pacer.*how)();
  // The thread has said so already, unless this is a callback on it.
  tap_->setNotRunning();
}

int32_t PacedTapQueue::dispose() {
  if (disposed_) return 0;
  if (const auto current = currentPacer()) end(&PCMPacer::abandon, *current);
  disposed_ = true;
  std::shared_ptr<PCMPacer> pacer;
  std::lock_guard lock(tap_->mutex);
  pacer.swap(pacer_);
  tap_->listener = nullptr;
  tap_->enqueued.clear();
  tap_->buffers.clear();
  return 0;
}

}  // namespace

int32_t PacedTapService::createInputQueue(const AudioStreamDescription& description, AppAudioInputCallback callback,
                                          uint32_t /*flags*/, std::unique_ptr<AppAudioTapQueue>& queue) {
  const auto format = PCMFormat::fromDescription(description);
  if (!format || !callback) return kTapFormatUnsupported;
  queue = std::make_unique<PacedTapQueue>(*format, std::move(callback), factory_, clock_);
  return 0;
}

}  // namespace qv::platform
