#pragma once

#include <functional>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "platform/ScreenCapture.h"

namespace qv::fakes {

/// 4 x 2 pixels at a host time in nanoseconds.
inline platform::SampleBufferRef makeFrame(int64_t nanoseconds) {
  auto frame = platform::SharedFrame::create({4, 2, 16, platform::PixelFormat::BGRX});
  return platform::SampleBuffer::makeVideo(std::make_shared<platform::PixelBuffer>(std::move(*frame)),
                                           platform::MediaTime::make(nanoseconds, platform::kHostTimescale),
                                           platform::MediaTime::invalid());
}

/// Frames come when a test sends them, in the test's thread.
class FakeScreenCaptureController final : public platform::ScreenCaptureController {
 public:
  FakeScreenCaptureController(platform::Size pictures, platform::MediaTime minimumInterval,
                              std::vector<FakeScreenCaptureController*>& all)
      : size(pictures), interval(minimumInterval), living(all) {
    living.push_back(this);
  }
  ~FakeScreenCaptureController() override { std::erase(living, this); }
  void setDelegate(std::weak_ptr<platform::ScreenCaptureControllerDelegate> to) override { delegate = std::move(to); }
  void startCapture() override { running = true; }
  void stopCapture() override {
    running = false;
    if (const auto call = std::exchange(atStop, nullptr)) call();
  }

  void send(const platform::SampleBufferRef& sample, uint64_t flags = 0) {
    if (const auto to = delegate.lock(); to && running) {
      to->screenCaptureControllerDidReceiveSampleBuffer(*this, sample, flags);
    }
  }
  void sendAt(int64_t nanoseconds, uint64_t flags = 0) { send(makeFrame(nanoseconds), flags); }

  const platform::Size size;
  const platform::MediaTime interval;
  std::vector<FakeScreenCaptureController*>& living;
  std::weak_ptr<platform::ScreenCaptureControllerDelegate> delegate;
  std::function<void()> atStop;
  bool running = false;
};

class FakeScreenCapture final : public platform::ScreenCaptureService, public platform::DisplayCloneService {
 public:
  std::unique_ptr<platform::ScreenCaptureController> createController(platform::Size size,
                                                                      platform::MediaTime interval) override {
    livingAtCreation.push_back(controllers.size());
    return std::make_unique<FakeScreenCaptureController>(size, interval, controllers);
  }
  platform::DisplayCloneService& displayClone() override { return *this; }
  void setMirroringMode(platform::DisplayCloneMode to) override { mode = to; }
  void setCloneContexts(std::set<uint32_t> to) override { contexts = std::move(to); }
  /// The newest controller of those that live, each as long as its session.
  FakeScreenCaptureController& last() { return *controllers.back(); }

  std::vector<FakeScreenCaptureController*> controllers;
  std::vector<size_t> livingAtCreation;  ///< for each that was made, how many there were
  platform::DisplayCloneMode mode = platform::DisplayCloneMode::Off;
  std::set<uint32_t> contexts;
};

}  // namespace qv::fakes
