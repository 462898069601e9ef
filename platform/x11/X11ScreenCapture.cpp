#include "platform/x11/X11ScreenCapture.h"

#include <sys/eventfd.h>

#include <atomic>
#include <cmath>
#include <thread>

#include "platform/threads/CallbackGate.h"
#include "platform/threads/Log.h"
#include "platform/x11/CaptureLoop.h"

namespace qv::platform {
namespace {

constexpr double kMaximumSide = 16384;
/// For an interval that is no number, or none.
constexpr std::chrono::nanoseconds kDefaultInterval{1'000'000'000 / 60};
constexpr std::chrono::nanoseconds kShortestInterval{1'000'000};

uint32_t wholePixels(double length) {
  if (!(length >= 1)) return 1;  // NaN too
  return static_cast<uint32_t>(std::min(std::floor(length), kMaximumSide));
}

std::chrono::nanoseconds intervalOf(const MediaTime& interval) {
  if (!interval.isNumeric() || interval.value <= 0) return kDefaultInterval;
  return std::max(kShortestInterval, std::chrono::nanoseconds(interval.valueAt(1'000'000'000)));
}

class X11ScreenCaptureController final : public ScreenCaptureController {
 public:
  X11ScreenCaptureController(CaptureParameters parameters, std::shared_ptr<X11DisplayClone> clone, Clock& clock)
      : parameters_(std::move(parameters)), clone_(std::move(clone)), clock_(clock) {}
  ~X11ScreenCaptureController() override { stopCapture(); }

  void setDelegate(std::weak_ptr<ScreenCaptureControllerDelegate> delegate) override {
    gate_->setDelegate(std::move(delegate));
  }
  void startCapture() override;
  void stopCapture() override;

 private:
  using Gate = DelegateGate<ScreenCaptureControllerDelegate>;
  /// One capture thread. What the thread uses is shared with it: it may outlive the controller
  /// for a moment when that is destroyed from within a callback.
  struct Run {
    FileDescriptor stopEvent{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};
    CallbackGate::Time time = 0;
    std::atomic<bool> hasEnded = false;
    std::thread thread;
  };
  CaptureEvents eventsOf(CallbackGate::Time time);
  static void end(std::shared_ptr<Run> run);

  const CaptureParameters parameters_;
  const std::shared_ptr<X11DisplayClone> clone_;
  Clock& clock_;
  const std::shared_ptr<Gate> gate_ = std::make_shared<Gate>();
  std::mutex mutex_;
  std::shared_ptr<Run> run_;  // guarded by mutex_
};

CaptureEvents X11ScreenCaptureController::eventsOf(CallbackGate::Time time) {
  CaptureEvents events;
  events.sample = [this, gate = gate_, time](const SampleBufferRef& sample) {
    return gate->enter(time, [&](auto& d) { d.screenCaptureControllerDidReceiveSampleBuffer(*this, sample, 0); });
  };
  events.failed = [this, gate = gate_, time](int32_t status) {
    gate->enter(time, [&](auto& d) { d.screenCaptureControllerDidFailWithStatus(*this, status); });
  };
  events.serverLost = [this, gate = gate_, time] {
    gate->enter(time, [&](auto& d) { d.screenCaptureControllerMediaServicesWereReset(*this); });
  };
  return events;
}

void X11ScreenCaptureController::startCapture() {
  std::unique_lock lock(mutex_);
  if (run_ && !run_->hasEnded) return;
  if (auto former = std::move(run_)) end(std::move(former));
  auto parameters = parameters_;
  const auto shown = clone_->state();
  parameters.mode = shown.mode;
  parameters.contexts = shown.contexts;
  run_ = std::make_shared<Run>();
  run_->time = gate_->open();
  run_->thread = std::thread(
      [run = run_, gate = gate_, &clock = clock_, parameters = std::move(parameters), events = eventsOf(run_->time)] {
        const ScopedSigpipeBlock noSigpipe;
        CaptureLoop(parameters, events, clock, run->stopEvent.get()).run();
        run->hasEnded = true;
      });
}

void X11ScreenCaptureController::stopCapture() {
  std::shared_ptr<Run> run;
  {
    std::lock_guard lock(mutex_);
    run = std::move(run_);
  }
  if (!run) return gate_->awaitIdle();
  ::eventfd_write(run->stopEvent.get(), 1);
  gate_->close(run->time);
  end(std::move(run));
}

void X11ScreenCaptureController::end(std::shared_ptr<Run> run) {
  // From within its own callback a thread cannot be waited for; it ends on its own right after.
  if (run->thread.get_id() == std::this_thread::get_id())
    run->thread.detach();
  else
    run->thread.join();
}

}  // namespace

void X11DisplayClone::setMirroringMode(DisplayCloneMode mode) {
  std::lock_guard lock(mutex_);
  state_.mode = mode;
}

void X11DisplayClone::setCloneContexts(std::set<uint32_t> contextIDs) {
  std::lock_guard lock(mutex_);
  state_.contexts = std::move(contextIDs);
}

X11DisplayClone::State X11DisplayClone::state() const {
  std::lock_guard lock(mutex_);
  return state_;
}

X11ScreenCaptureService::X11ScreenCaptureService(std::string display, Clock& clock)
    : display_(std::move(display)), clock_(clock) {}

std::unique_ptr<ScreenCaptureController> X11ScreenCaptureService::createController(Size size,
                                                                                   MediaTime minimumInterval) {
  CaptureParameters parameters;
  parameters.display = display_;
  const uint32_t width = wholePixels(size.width), height = wholePixels(size.height);
  parameters.layout = {width, height, width * 4, PixelFormat::BGRX};
  parameters.interval = intervalOf(minimumInterval);
  return std::make_unique<X11ScreenCaptureController>(std::move(parameters), clone_, clock_);
}

}  // namespace qv::platform
