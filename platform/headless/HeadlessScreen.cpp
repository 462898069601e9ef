#include "platform/headless/HeadlessScreen.h"

#include <algorithm>
#include <cmath>
#include <condition_variable>
#include <mutex>

#include "platform/headless/TestPattern.h"
#include "platform/threads/Clock.h"
#include "platform/threads/Log.h"
#include "platform/threads/PacedThread.h"

namespace qv::platform {
namespace {

using std::chrono::nanoseconds;

/// Rates beyond this are of no display.
constexpr nanoseconds kShortestInterval = std::chrono::milliseconds(1);
constexpr nanoseconds kLongestInterval = std::chrono::milliseconds(500);  // the heartbeat

uint32_t pixels(double side) {
  if (!(side >= 1)) return 1;
  return static_cast<uint32_t>(std::min(side, 16384.0));
}

/// Deadlines at the multiples of a rational interval.
struct FrameGrid {
  explicit FrameGrid(MediaTime interval) : value(interval.value), timescale(interval.timescale) {
    if (!interval.isNumeric() || interval.value <= 0 || interval.seconds() * 1e9 < kShortestInterval.count()) {
      value = 1;
      timescale = 60;
    } else if (interval.seconds() * 1e9 > kLongestInterval.count()) {
      value = 1;
      timescale = 2;
    }
  }
  [[nodiscard]] int64_t indexAt(nanoseconds time) const {
    return static_cast<int64_t>(static_cast<__int128>(time.count()) * timescale / value / kHostTimescale);
  }
  /// Rounded up, so that a deadline that falls on a whole second is not just before it.
  [[nodiscard]] nanoseconds timeOf(int64_t index) const {
    const __int128 ticks = static_cast<__int128>(index) * value * kHostTimescale;
    return nanoseconds(static_cast<int64_t>((ticks + timescale - 1) / timescale));
  }
  int64_t value;
  int64_t timescale;
};

/// Calls the delegate, one call at a time, in a way that can be waited for.
///
/// Threading: thread-safe.
class DelegateGate {
 public:
  void setDelegate(std::weak_ptr<ScreenCaptureControllerDelegate> delegate) {
    std::unique_lock lock(mutex_);
    delegate_ = std::move(delegate);
    waitForCall(lock);
  }
  void wait() {
    std::unique_lock lock(mutex_);
    waitForCall(lock);
  }
  /// Whether a call would be made now.
  bool isOpen() {
    std::lock_guard lock(mutex_);
    return !delegate_.expired() && !calling_;
  }
  template <typename Call>
  void call(const Call& function) {
    std::unique_lock lock(mutex_);
    auto delegate = delegate_.lock();
    if (!delegate || calling_) return;
    calling_ = true;
    caller_ = std::this_thread::get_id();
    lock.unlock();
    function(*delegate);
    delegate.reset();
    lock.lock();
    calling_ = false;
    ended_.notify_all();
  }

 private:
  void waitForCall(std::unique_lock<std::mutex>& lock) {
    ended_.wait(lock, [this] { return !calling_ || caller_ == std::this_thread::get_id(); });
  }

  std::mutex mutex_;
  std::condition_variable ended_;
  std::weak_ptr<ScreenCaptureControllerDelegate> delegate_;
  std::thread::id caller_;
  bool calling_ = false;
};

/// What a controller keeps from one start to the next.
///
/// Threading: `mutex` guards it, for a capture that winds down may meet its successor.
struct Picture {
  std::mutex mutex;
  TestPattern pattern;
  uint32_t number = 0;
};

/// One start to stop of a controller.
///
/// Threading: its thread's own, but for the atomic.
struct Capture {
  PacedThread::TimePoint step();
  void deliver(nanoseconds time);
  std::shared_ptr<SharedFrame> nextFrame(nanoseconds time);
  void countFrame() {
    std::lock_guard lock(picture->mutex);
    ++picture->number;
  }

  ScreenCaptureController& controller;
  const FrameLayout layout;
  const FrameGrid grid;
  const std::shared_ptr<HeadlessScreen::CloneState> clone;
  const std::shared_ptr<DelegateGate> gate;
  const std::shared_ptr<Picture> picture;
  PacedClock& clock;
  const bool showsPicture = clone->showsPicture();
  bool hasBegun = false;
  int64_t next = 0;
  std::atomic<bool> stopped = false;
};

PacedThread::TimePoint Capture::step() {
  const nanoseconds now = clock.now().time_since_epoch();
  if (!hasBegun) {
    hasBegun = true;
    deliver(now);
    next = grid.indexAt(now + grid.timeOf(1)) + 1;
  } else if (now >= grid.timeOf(next)) {
    // A thread that comes late takes the picture of now: it does not make up for those it missed.
    next = std::max(next, grid.indexAt(now));
    deliver(grid.timeOf(next));
    ++next;
  }
  return PacedThread::TimePoint(grid.timeOf(next));
}

void Capture::deliver(nanoseconds time) {
  if (stopped || !gate->isOpen()) return;
  const auto frame = nextFrame(time);
  if (!frame) {
    QV_LOG_DEBUG(logs::kScreen, "every frame is in use, picture left out");
    return;
  }
  const auto image = std::make_shared<PixelBuffer>(frame);
  const auto pts = mediaTimeFromHostTime(static_cast<uint64_t>(time.count()));
  const auto sample =
      SampleBuffer::makeVideo(image, pts, MediaTime::make(grid.value, static_cast<int32_t>(grid.timescale)));
  gate->call([&](ScreenCaptureControllerDelegate& delegate) {
    countFrame();
    delegate.screenCaptureControllerDidReceiveSampleBuffer(controller, sample, 0);
  });
}

std::shared_ptr<SharedFrame> Capture::nextFrame(nanoseconds time) {
  std::lock_guard lock(picture->mutex);
  if (!showsPicture) return picture->pattern.paintBlack(layout);
  return picture->pattern.paint(layout, picture->number, static_cast<uint64_t>(time.count()));
}

/// Threading: as ScreenCaptureController.
class HeadlessController final : public ScreenCaptureController {
 public:
  HeadlessController(Size size, MediaTime interval, std::shared_ptr<HeadlessScreen::CloneState> clone,
                     PacedClock& clock)
      : layout_{pixels(size.width), pixels(size.height), pixels(size.width) * 4, PixelFormat::BGRX},
        grid_(interval),
        clone_(std::move(clone)),
        clock_(clock) {}
  ~HeadlessController() override { HeadlessController::stopCapture(); }

  void setDelegate(std::weak_ptr<ScreenCaptureControllerDelegate> delegate) override {
    gate_->setDelegate(std::move(delegate));
  }
  void startCapture() override {
    std::lock_guard lock(mutex_);
    if (thread_) return;
    capture_ = std::shared_ptr<Capture>(new Capture{*this, layout_, grid_, clone_, gate_, picture_, clock_});
    thread_ = std::make_unique<PacedThread>([capture = capture_] { return capture->step(); }, nullptr, clock_);
  }
  void stopCapture() override {
    std::unique_ptr<PacedThread> thread;
    {
      std::lock_guard lock(mutex_);
      if (capture_) capture_->stopped = true;
      capture_.reset();
      thread = std::move(thread_);
    }
    thread.reset();
    gate_->wait();
  }

 private:
  const FrameLayout layout_;
  const FrameGrid grid_;
  const std::shared_ptr<HeadlessScreen::CloneState> clone_;
  PacedClock& clock_;
  const std::shared_ptr<DelegateGate> gate_ = std::make_shared<DelegateGate>();
  const std::shared_ptr<Picture> picture_ = std::make_shared<Picture>();
  std::mutex mutex_;
  std::shared_ptr<Capture> capture_;
  std::unique_ptr<PacedThread> thread_;
};

}  // namespace

std::unique_ptr<ScreenCaptureController> HeadlessScreen::createController(Size size, MediaTime minimumInterval) {
  return std::make_unique<HeadlessController>(size, minimumInterval, shared_, clock_);
}

}  // namespace qv::platform
