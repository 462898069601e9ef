#include "platform/headless/HeadlessScreen.h"

#include <algorithm>
#include <cmath>
#include <mutex>

#include "platform/headless/TestPattern.h"
#include "platform/threads/CallbackGate.h"
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

using Gate = DelegateGate<ScreenCaptureControllerDelegate>;

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
/// Threading: its thread's own.
struct Capture {
  PacedThread::TimePoint step();
  void deliver(nanoseconds moment);
  std::shared_ptr<SharedFrame> nextFrame(nanoseconds moment);
  void countFrame() {
    std::lock_guard lock(picture->mutex);
    ++picture->number;
  }

  ScreenCaptureController& controller;
  const FrameLayout layout;
  const FrameGrid grid;
  const std::shared_ptr<HeadlessScreen::CloneState> clone;
  const std::shared_ptr<Gate> gate;
  const CallbackGate::Time time;
  const std::shared_ptr<Picture> picture;
  PacedClock& clock;
  const bool showsPicture = clone->showsPicture();
  bool hasBegun = false;
  int64_t next = 0;
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

void Capture::deliver(nanoseconds moment) {
  gate->enter(time, [&](ScreenCaptureControllerDelegate& delegate) {
    const auto frame = nextFrame(moment);
    if (!frame) {
      QV_LOG_DEBUG(logs::kScreen, "every frame is in use, picture left out");
      return;
    }
    const auto image = std::make_shared<PixelBuffer>(frame);
    const auto pts = mediaTimeFromHostTime(static_cast<uint64_t>(moment.count()));
    const auto sample =
        SampleBuffer::makeVideo(image, pts, MediaTime::make(grid.value, static_cast<int32_t>(grid.timescale)));
    countFrame();
    delegate.screenCaptureControllerDidReceiveSampleBuffer(controller, sample, 0);
  });
}

std::shared_ptr<SharedFrame> Capture::nextFrame(nanoseconds moment) {
  std::lock_guard lock(picture->mutex);
  if (!showsPicture) return picture->pattern.paintBlack(layout);
  return picture->pattern.paint(layout, picture->number, static_cast<uint64_t>(moment.count()));
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
    time_ = gate_->open();
    const auto capture =
        std::shared_ptr<Capture>(new Capture{*this, layout_, grid_, clone_, gate_, time_, picture_, clock_});
    thread_ = std::make_unique<PacedThread>([capture] { return capture->step(); }, nullptr, clock_);
  }
  /// The gate first: the thread may be waiting there for one that was stopped within its call.
  void stopCapture() override {
    std::unique_ptr<PacedThread> thread;
    CallbackGate::Time time = 0;
    {
      std::lock_guard lock(mutex_);
      thread = std::move(thread_);
      time = time_;
    }
    gate_->close(time);
  }

 private:
  const FrameLayout layout_;
  const FrameGrid grid_;
  const std::shared_ptr<HeadlessScreen::CloneState> clone_;
  PacedClock& clock_;
  const std::shared_ptr<Gate> gate_ = std::make_shared<Gate>();
  const std::shared_ptr<Picture> picture_ = std::make_shared<Picture>();
  std::mutex mutex_;
  // Guarded by mutex_:
  CallbackGate::Time time_ = gate_->open();  // of the thread, or of the last
  std::unique_ptr<PacedThread> thread_;
};

}  // namespace

std::unique_ptr<ScreenCaptureController> HeadlessScreen::createController(Size size, MediaTime minimumInterval) {
  return std::make_unique<HeadlessController>(size, minimumInterval, shared_, clock_);
}

}  // namespace qv::platform
