#include "capture/QVScreenSource.h"

#include <mutex>
#include <utility>

#include "platform/threads/Log.h"

namespace qv {

using platform::DisplayCloneMode;
using platform::MediaTime;
namespace logs = platform::logs;

namespace {

/// A controller, and what it was made for.
struct Controller {
  [[nodiscard]] bool fits(const ScreenRequest& request) const {
    return controller && size == request.size && frameRate == request.frameRate;
  }
  std::unique_ptr<platform::ScreenCaptureController> controller;
  platform::Size size;
  int32_t frameRate = 0;
};

}  // namespace

/// What the leases share.
///
/// Threading: `mutex` guards all but the reference. It is held while a controller starts, which waits for no callback,
/// and never while one stops.
struct QVScreenSource::State {
  explicit State(platform::ScreenCaptureService& captureService) : service(captureService) {}

  void point(const Lease& lease, const ScreenRequest& request);
  Controller takeController(const ScreenRequest& request);

  platform::ScreenCaptureService& service;
  std::mutex mutex;
  const Lease* pointing = nullptr;  ///< the lease that the clone service was pointed for last, while it lives
  Controller spare;
};

class QVScreenSource::Lease final : public ScreenLease {
 public:
  Lease(std::shared_ptr<State> state, ScreenRequest request,
        const std::weak_ptr<platform::ScreenCaptureControllerDelegate>& delegate);
  ~Lease() override;
  void startCapture() override;

 private:
  const std::shared_ptr<State> state_;
  const ScreenRequest request_;
  Controller capture_;
  bool started_ = false;  // guarded by the state's mutex
};

/// With the lock held.
void QVScreenSource::State::point(const Lease& lease, const ScreenRequest& request) {
  platform::DisplayCloneService& displayClone = service.displayClone();
  if (request.mode == DisplayCloneMode::CloneContexts) displayClone.setCloneContexts(request.contextIDs);
  displayClone.setMirroringMode(request.mode);
  pointing = &lease;
}

Controller QVScreenSource::State::takeController(const ScreenRequest& request) {
  // One that does not fit gives its frames' memory back before the next is made.
  Controller kept;
  {
    std::lock_guard lock(mutex);
    kept = std::exchange(spare, {});
  }
  if (kept.fits(request)) return kept;
  kept.controller.reset();
  return {service.createController(request.size, MediaTime::make(1, request.frameRate)), request.size,
          request.frameRate};
}

QVScreenSource::Lease::Lease(std::shared_ptr<State> state, ScreenRequest request,
                             const std::weak_ptr<platform::ScreenCaptureControllerDelegate>& delegate)
    : state_(std::move(state)), request_(std::move(request)) {
  if (request_.mode == DisplayCloneMode::MirrorScreen) QV_LOG(logs::kSession, "mirror mode");
  if (request_.mode == DisplayCloneMode::CloneContexts) QV_LOG(logs::kSession, "quorvel mode");
  {
    std::lock_guard lock(state_->mutex);
    state_->point(*this, request_);
  }
  capture_ = state_->takeController(request_);
  capture_.controller->setDelegate(delegate);
}

void QVScreenSource::Lease::startCapture() {
  std::lock_guard lock(state_->mutex);
  if (std::exchange(started_, true)) return;
  QV_LOG(logs::kSession, "starting capture with VellCaptureController");
  // The controller takes up what the clone service shows at this moment.
  if (state_->pointing != this) state_->point(*this, request_);
  capture_.controller->startCapture();
}

QVScreenSource::Lease::~Lease() {
  capture_.controller->stopCapture();
  capture_.controller->setDelegate({});
  std::lock_guard lock(state_->mutex);
  if (state_->pointing == this) {
    QV_LOG(logs::kSession, "Stop mirroring");
    state_->service.displayClone().setMirroringMode(DisplayCloneMode::Off);
    state_->pointing = nullptr;
  }
  // The former spare goes with this lease, after the lock.
  std::swap(state_->spare, capture_);
}

QVScreenSource::QVScreenSource(platform::ScreenCaptureService& service) : state_(std::make_shared<State>(service)) {}

QVScreenSource::~QVScreenSource() = default;

std::unique_ptr<ScreenLease> QVScreenSource::lease(
    const ScreenRequest& request, const std::weak_ptr<platform::ScreenCaptureControllerDelegate>& delegate) {
  return std::make_unique<Lease>(state_, request, delegate);
}

}  // namespace qv
