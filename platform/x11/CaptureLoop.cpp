#include "platform/x11/CaptureLoop.h"

#include <poll.h>
#include <xcb/composite.h>
#include <xcb/damage.h>

#include <algorithm>

#include "platform/threads/Clock.h"
#include "platform/threads/Log.h"
#include "platform/x11/CloneSource.h"
#include "platform/x11/ScreenSource.h"

namespace qv::platform {
namespace {

using std::chrono::nanoseconds;

/// Frames that may be on their way to encoders, clients and extensions at once: more than the link to an extension
/// holds (12), so that of a slow one's frames the oldest are dropped there and not the newest here.
constexpr size_t kPoolCapacity = 14;
/// Below half a second by what a loaded machine may oversleep.
constexpr nanoseconds kHeartbeat = std::chrono::milliseconds(450);
/// Longer than any grab takes on a loaded machine; a server that is silent for longer is lost.
constexpr std::chrono::milliseconds kCaptureReplyLimit{5000};

nanoseconds monotonicNow() { return nanoseconds(hostNanoseconds()); }

/// Tells the server which versions are spoken: it refuses requests of these extensions otherwise.
bool negotiateExtensions(XcbConnection& connection) {
  for (xcb_extension_t* extension : {&xcb_shm_id, &xcb_composite_id, &xcb_damage_id, &xcb_xfixes_id})
    if (!connection.hasExtension(*extension)) return false;
  xcb_connection_t* c = connection.get();
  const auto shmCookie = xcb_shm_query_version(c);
  const auto compositeCookie = xcb_composite_query_version(c, 0, 4);
  const auto damageCookie = xcb_damage_query_version(c, 1, 1);
  const auto fixesCookie = xcb_xfixes_query_version(c, 5, 0);
  auto shm = connection.await<xcb_shm_query_version_reply_t>(shmCookie);
  auto composite = connection.await<xcb_composite_query_version_reply_t>(compositeCookie);
  auto damage = connection.await<xcb_damage_query_version_reply_t>(damageCookie);
  auto fixes = connection.await<xcb_xfixes_query_version_reply_t>(fixesCookie);
  if (!shm || !composite || !damage || !fixes) return false;
  const bool hasMemoryFiles = shm->major_version > 1 || (shm->major_version == 1 && shm->minor_version >= 2);
  const bool namesPixmaps = composite->major_version > 0 || composite->minor_version >= 2;
  return hasMemoryFiles && namesPixmaps && fixes->major_version >= 2;
}

}  // namespace

CaptureLoop::CaptureLoop(CaptureParameters parameters, CaptureEvents events, Clock& clock, int stopFd)
    : parameters_(std::move(parameters)),
      events_(std::move(events)),
      clock_(clock),
      stopFd_(stopFd),
      pool_(kPoolCapacity) {}

void CaptureLoop::run() {
  auto opened = XcbConnection::open(parameters_.display, kCaptureReplyLimit);
  if (!opened) {
    QV_LOG_ERROR(logs::kScreen, "screen capture: %s", opened.error().description().c_str());
    return events_.serverLost();
  }
  connection_ = std::move(opened.value());
  if (const auto status = openSource(); status && !connection_->isLost()) {
    QV_LOG_ERROR(logs::kScreen, "screen capture is not possible, status %d", *status);
    return events_.failed(*status);
  }
  loop();
}

std::optional<int32_t> CaptureLoop::openSource() {
  if (!negotiateExtensions(*connection_)) return kCaptureStatusUnavailable;
  if (parameters_.mode == DisplayCloneMode::MirrorScreen) {
    source_ = std::make_unique<ScreenSource>(*connection_);
  } else {
    const bool clones = parameters_.mode == DisplayCloneMode::CloneContexts;
    source_ = std::make_unique<CloneSource>(*connection_, clones ? parameters_.contexts : std::set<uint32_t>{});
  }
  pointer_ = std::make_unique<PointerOverlay>(*connection_);
  composer_ = std::make_unique<FrameComposer>(*connection_);
  nextTick_ = nextHeartbeat_ = monotonicNow();
  return source_->failure();
}

void CaptureLoop::loop() {
  while (true) {
    if (!connection_->isLost()) handleEvents();
    if (connection_->isLost()) {
      QV_LOG_ERROR(logs::kScreen, "screen capture: the X server has gone");
      return events_.serverLost();
    }
    const auto now = monotonicNow();
    const bool isDue = mayHaveChanged() && now >= nextTick_;
    if (isDue) {
      advanceTick(now);
      if (!takePictureIfChanged()) return;
    } else if (lastFrame_ && now >= nextHeartbeat_) {
      if (!deliver(clock_.hostTime())) return;
    } else if (mayHaveChanged()) {
      if (!sleepUntil(lastFrame_ ? std::min(nextTick_, nextHeartbeat_) : nextTick_, false)) return;
    } else if (!sleepUntil(nextHeartbeat_, true)) {
      return;
    }
  }
}

void CaptureLoop::handleEvents() {
  while (auto event = connection_->pollEvent()) {
    // Errors (type 0) are of requests on windows that have just gone: their events tell more.
    if (event->response_type == 0) continue;
    source_->handleEvent(*event);
    pointer_->handleEvent(*event);
  }
}

bool CaptureLoop::takePictureIfChanged() {
  pointer_->request();
  if (source_->hasChanged()) return takePicture();
  if (pointer_->update(*source_) && !connection_->isLost()) {
    pointer_->request();
    return takePicture();
  }
  return true;
}

bool CaptureLoop::takePicture() {
  auto frame = pool_.take(parameters_.layout);
  if (!frame) {
    // Whoever holds the frames is behind: this tick is left out.
    QV_LOG_DEBUG(logs::kScreen, "screen capture: all frames are in use");
    pointer_->update(*source_);
    return true;
  }
  const MediaTime time = clock_.hostTime();
  const auto outcome = composer_->compose(source_->takeLayers(), *frame);
  pointer_->update(*source_);
  if (connection_->isLost()) return true;
  if (outcome == FrameComposer::Outcome::LayerLost) source_->layerWasLost();
  const auto failure = outcome == FrameComposer::Outcome::NoSharedMemory
                           ? std::optional<int32_t>(kCaptureStatusUnavailable)
                           : source_->failure();
  if (failure) {
    QV_LOG_ERROR(logs::kScreen, "screen capture failed with status %d", *failure);
    events_.failed(*failure);
    return false;
  }
  pointer_->draw(composer_->mapping(), *frame);
  lastFrame_ = std::move(frame);
  return deliver(time);
}

bool CaptureLoop::deliver(MediaTime time) {
  if (time <= lastTime_) time = MediaTime::make(lastTime_.value + 1, kHostTimescale);
  lastTime_ = time;
  nextHeartbeat_ = monotonicNow() + kHeartbeat;
  return events_.sample(SampleBuffer::makeVideo(std::make_shared<PixelBuffer>(lastFrame_), time, MediaTime::invalid()));
}

void CaptureLoop::advanceTick(nanoseconds now) {
  // On the grid while pictures follow each other; a new grid after a rest.
  nextTick_ = now - nextTick_ < parameters_.interval ? nextTick_ + parameters_.interval : now + parameters_.interval;
}

bool CaptureLoop::sleepUntil(nanoseconds deadline, bool wakeForEvents) {
  xcb_flush(connection_->get());
  const auto left = std::max(deadline - monotonicNow(), nanoseconds(0));
  const timespec timeout{static_cast<time_t>(left.count() / 1'000'000'000),
                         static_cast<long>(left.count() % 1'000'000'000)};
  pollfd descriptors[] = {{stopFd_, POLLIN, 0}, {connection_->fd(), POLLIN, 0}};
  ::ppoll(descriptors, wakeForEvents ? 2 : 1, &timeout, nullptr);
  return (descriptors[0].revents & POLLIN) == 0;
}

}  // namespace qv::platform
