#pragma once

#include <array>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/AppAudioTap.h"
#include "platform/DeviceCapture.h"

namespace qv::fakes {

class FakeDeviceCapture final : public platform::DeviceCaptureService, public platform::AudioSession {
 public:
  struct Input final : platform::CaptureDeviceInput {};
  struct Output final : platform::AudioDataOutput {
    void setSampleDelegate(platform::CaptureOutputDelegate* to, platform::SerialQueue* on) override {
      delegate = to;
      queue = on;
    }
    platform::CaptureOutputDelegate* delegate = nullptr;
    platform::SerialQueue* queue = nullptr;
  };
  struct Session final : platform::DeviceCaptureSession {
    void setUsesApplicationAudioSession(bool uses) override { usesApplicationAudioSession = uses; }
    void setAutomaticallyConfiguresApplicationAudioSession(bool configures) override {
      configuresAutomatically = configures;
    }
    bool canAddInput(const std::shared_ptr<platform::CaptureDeviceInput>& input) const override {
      return input != nullptr;
    }
    void addInput(std::shared_ptr<platform::CaptureDeviceInput>) override { ++inputs; }
    void removeInput(const std::shared_ptr<platform::CaptureDeviceInput>&) override { --inputs; }
    bool canAddOutput(const std::shared_ptr<platform::CaptureOutput>& output) const override {
      return output != nullptr;
    }
    void addOutput(std::shared_ptr<platform::CaptureOutput>) override { ++outputs; }
    void removeOutput(const std::shared_ptr<platform::CaptureOutput>&) override { --outputs; }
    void startRunning() override {
      if (!startsLate) setRunning(true);
    }
    void stopRunning() override {
      ++stops;
      if (atStop) atStop();
      setRunning(false);
    }
    bool isRunning() const override { return running; }
    void setRunningObserver(std::function<void()> to) override { observer = std::move(to); }
    void setRunning(bool to) {
      running = to;
      if (const auto call = observer) call();
    }
    int inputs = 0, outputs = 0, stops = 0;
    bool running = false, startsLate = false, usesApplicationAudioSession = false, configuresAutomatically = true;
    std::function<void()> observer;
    std::function<void()> atStop;  ///< what it still has is delivered here
  };

  std::shared_ptr<platform::DeviceCaptureSession> createSession() override {
    session = std::make_shared<Session>();
    session->startsLate = startsLate;
    return session;
  }
  std::shared_ptr<platform::CaptureDeviceInput> createDefaultAudioInput() override { return std::make_shared<Input>(); }
  std::shared_ptr<platform::AudioDataOutput> createAudioDataOutput() override {
    return output = std::make_shared<Output>();
  }
  platform::AudioSession& audioSession() override { return *this; }
  int32_t setCategory(platform::AudioSessionCategory, uint32_t options) override {
    categoryOptions = options;
    return 0;
  }
  void setInterruptionObserver(std::function<void(uint32_t)> to) override { interruption = std::move(to); }
  /// Delivers on the output's queue, as a device does.
  void send(const platform::SampleBufferRef& sample) {
    output->queue->async([to = output, sample] { to->delegate->captureOutputDidOutputSampleBuffer(*to, sample); });
  }

  uint32_t categoryOptions = 0;
  bool startsLate = false;  ///< the test tells when a session runs
  std::shared_ptr<Session> session;
  std::shared_ptr<Output> output;
  std::function<void(uint32_t)> interruption;
};

/// The queue of the newest tap is driven by the test.
class FakeAppAudioTap final : public platform::AppAudioTapService {
 public:
  struct State {
    int32_t process = 0;
    bool running = false, disposed = false;
    platform::AppAudioInputCallback callback;
    std::function<void()> listener;
    std::function<void()> atStop;  ///< what it still has is handed over here
    std::vector<platform::QueueBuffer*> enqueued;
    std::vector<uint32_t> capacities;
    int freed = 0;
  };
  struct Queue final : platform::AppAudioTapQueue {
    Queue(FakeAppAudioTap& fake, platform::AudioStreamDescription format, std::shared_ptr<State> tap)
        : service(fake), description(format), state(std::move(tap)) {}
    int32_t setTappedProcess(int32_t process) override {
      state->process = process;
      return service.status("setTappedProcess");
    }
    int32_t streamDescription(platform::AudioStreamDescription& to) override {
      to = service.reported.value_or(description);
      return 0;
    }
    int32_t maximumOutputPacketSize(uint32_t& size) override {
      size = 3;
      return 0;
    }
    int32_t allocateBuffer(uint32_t size, platform::QueueBuffer*& buffer) override {
      if (buffers.size() == service.mostBuffers) return -108;
      memory.push_back(std::make_unique<std::vector<uint8_t>>(size));
      buffers.push_back(std::make_unique<platform::QueueBuffer>(platform::QueueBuffer{size, memory.back()->data(), 0}));
      state->capacities.push_back(size);
      buffer = buffers.back().get();
      return 0;
    }
    int32_t enqueueBuffer(platform::QueueBuffer* buffer) override {
      state->enqueued.push_back(buffer);
      return 0;
    }
    int32_t addIsRunningListener(std::function<void()> to) override {
      state->listener = std::move(to);
      return 0;
    }
    int32_t removeIsRunningListener() override {
      state->listener = nullptr;
      return 0;
    }
    int32_t start() override {
      if (const int32_t failure = service.status("start")) return failure;
      state->running = true;
      if (const auto call = state->listener; call && !service.startsLate) call();
      return 0;
    }
    int32_t stop() override {
      if (state->atStop) state->atStop();
      state->running = false;
      return service.status("stop");
    }
    int32_t freeBuffer(platform::QueueBuffer*) override {
      ++state->freed;
      return service.status("freeBuffer");
    }
    int32_t dispose() override {
      state->disposed = true;
      return 0;
    }
    FakeAppAudioTap& service;
    const platform::AudioStreamDescription description;
    const std::shared_ptr<State> state;
    std::vector<std::unique_ptr<std::vector<uint8_t>>> memory;
    std::vector<std::unique_ptr<platform::QueueBuffer>> buffers;
  };

  int32_t createInputQueue(const platform::AudioStreamDescription& format, platform::AppAudioInputCallback callback,
                           uint32_t, std::unique_ptr<platform::AppAudioTapQueue>& queue) override {
    if (const int32_t failure = status("create")) return failure;
    tap = std::make_shared<State>();
    tap->callback = std::move(callback);
    taps.push_back(tap);
    queue = std::make_unique<Queue>(*this, format, tap);
    return 0;
  }
  int32_t status(const std::string& operation) const {
    const auto it = failures.find(operation);
    return it == failures.end() ? 0 : it->second;
  }
  /// Fills the tap's next buffer and hands it over. False when none is enqueued.
  bool fill(uint32_t frames, int64_t hostTime) { return fill(*tap, frames, hostTime); }
  static bool fill(State& state, uint32_t frames, int64_t hostTime) {
    return fill(state, std::vector<uint8_t>(size_t{frames} * 2, 7), static_cast<uint64_t>(hostTime));
  }
  /// The same with these bytes, of one packet for each frame of two bytes.
  static bool fill(State& state, const std::vector<uint8_t>& bytes, uint64_t hostTime) {
    if (state.enqueued.empty()) return false;
    platform::QueueBuffer* buffer = state.enqueued.front();
    state.enqueued.erase(state.enqueued.begin());
    buffer->byteSize = static_cast<uint32_t>(bytes.size());
    std::copy(bytes.begin(), bytes.end(), buffer->data);
    platform::AudioTimeStamp start;
    start.hostTime = hostTime;
    state.callback(buffer, start, static_cast<uint32_t>(bytes.size() / 2));
    return true;
  }

  std::shared_ptr<State> tap;
  std::vector<std::shared_ptr<State>> taps;
  std::map<std::string, int32_t> failures;
  size_t mostBuffers = SIZE_MAX;                             ///< of one tap
  std::optional<platform::AudioStreamDescription> reported;  ///< where it is not what was asked for
  bool startsLate = false;                                   ///< the test tells when a tap runs, by its listener
};

}  // namespace qv::fakes
