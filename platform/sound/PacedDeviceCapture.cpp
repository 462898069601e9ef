#include "platform/sound/PacedDeviceCapture.h"

#include "platform/threads/CallbackGate.h"
#include "platform/threads/Clock.h"

namespace qv::platform {
namespace {

constexpr PCMFormat kFormat{.sampleRate = 44100, .channels = 1, .isBigEndian = true};
constexpr size_t kBytesPerSample = 2 * 1024;

/// Threading: immutable.
class MicrophoneInput final : public CaptureDeviceInput {};

/// Threading: thread-safe. Whoever takes the delegate away waits for a callback in progress, except within one.
class MicrophoneOutput final : public AudioDataOutput, public std::enable_shared_from_this<MicrophoneOutput> {
 public:
  void setSampleDelegate(CaptureOutputDelegate* delegate, SerialQueue* queue) override {
    {
      std::lock_guard lock(mutex_);
      delegate_ = delegate;
      queue_ = queue;
    }
    gate_.awaitIdle();
  }
  void attach() {
    std::lock_guard lock(mutex_);
    attached_ = true;
  }
  void detach() {
    {
      std::lock_guard lock(mutex_);
      attached_ = false;
    }
    gate_.awaitIdle();
  }
  void send(SampleBufferRef sample) {
    std::lock_guard lock(mutex_);
    if (!attached_ || delegate_ == nullptr || queue_ == nullptr) return;
    queue_->async([self = shared_from_this(), sample = std::move(sample)] { self->deliver(sample); });
  }

 private:
  void deliver(const SampleBufferRef& sample) {
    gate_.enter([&] {
      if (CaptureOutputDelegate* delegate = currentDelegate())
        delegate->captureOutputDidOutputSampleBuffer(*this, sample);
    });
  }
  CaptureOutputDelegate* currentDelegate() {
    std::lock_guard lock(mutex_);
    return attached_ ? delegate_ : nullptr;
  }

  CallbackGate gate_;
  std::mutex mutex_;
  CaptureOutputDelegate* delegate_ = nullptr;
  SerialQueue* queue_ = nullptr;
  bool attached_ = false;
};

/// Gathers a pacer's blocks into samples.
///
/// Threading: the pacer's thread.
class SampleAssembler {
 public:
  explicit SampleAssembler(std::shared_ptr<MicrophoneOutput> output) : output_(std::move(output)) {}

  void take(const PCMBlock& block) {
    if (block.sampleTime != nextSampleTime_) flush();
    for (size_t offset = 0; offset < block.bytes.size();) {
      const size_t skipped = offset / kFormat.bytesPerFrame();
      if (bytes_.empty()) hostTime_ = block.hostTime + skipped * 1'000'000'000 / kFormat.sampleRate;
      const size_t count = std::min(kBytesPerSample - bytes_.size(), block.bytes.size() - offset);
      const auto part = block.bytes.subspan(offset, count);
      bytes_.insert(bytes_.end(), part.begin(), part.end());
      offset += count;
      if (bytes_.size() == kBytesPerSample) flush();
    }
    nextSampleTime_ = block.sampleTime + block.frames;
  }
  /// Sends what is gathered, less than a whole sample.
  void flush() {
    if (bytes_.empty()) return;
    const auto frames = static_cast<int64_t>(bytes_.size() / kFormat.bytesPerFrame());
    auto data = std::make_shared<DataBlock>(std::exchange(bytes_, {}));
    output_->send(SampleBuffer::makeAudio(std::move(data), format_, frames, mediaTimeFromHostTime(hostTime_)));
    bytes_.reserve(kBytesPerSample);
  }

 private:
  const std::shared_ptr<MicrophoneOutput> output_;
  const AudioFormatDescriptionRef format_ =
      std::make_shared<AudioFormatDescription>(AudioFormatDescription{kFormat.description()});
  std::vector<uint8_t> bytes_;
  uint64_t hostTime_ = 0;
  int64_t nextSampleTime_ = 0;
};

/// Threading: thread-safe. The pacer's thread never takes `mutex_`, so it may be stopped under it.
class PacedCaptureSession final : public DeviceCaptureSession {
 public:
  PacedCaptureSession(const MicrophoneSource& microphone, PacedClock& clock) : microphone_(microphone), clock_(clock) {}
  ~PacedCaptureSession() override {
    pacer_.reset();
    if (output_) output_->detach();
  }

  /// The audio of this process has one session for all, and it is always set up: nothing to choose.
  void setUsesApplicationAudioSession(bool /*uses*/) override {}
  void setAutomaticallyConfiguresApplicationAudioSession(bool /*configures*/) override {}

  bool canAddInput(const std::shared_ptr<CaptureDeviceInput>& input) const override {
    std::lock_guard lock(mutex_);
    return acceptsInput(input);
  }
  void addInput(std::shared_ptr<CaptureDeviceInput> input) override {
    std::lock_guard lock(mutex_);
    if (!acceptsInput(input)) return;
    input_ = std::move(input);
    update();
  }
  void removeInput(const std::shared_ptr<CaptureDeviceInput>& input) override {
    std::lock_guard lock(mutex_);
    if (!input || input != input_) return;
    input_.reset();
    update();
  }
  bool canAddOutput(const std::shared_ptr<CaptureOutput>& output) const override {
    std::lock_guard lock(mutex_);
    return acceptsOutput(output);
  }
  void addOutput(std::shared_ptr<CaptureOutput> output) override {
    std::lock_guard lock(mutex_);
    if (!acceptsOutput(output)) return;
    output_ = std::dynamic_pointer_cast<MicrophoneOutput>(output);
    output_->attach();
    update();
  }
  void removeOutput(const std::shared_ptr<CaptureOutput>& output) override {
    std::shared_ptr<MicrophoneOutput> removed;
    {
      std::lock_guard lock(mutex_);
      if (!output || output != output_) return;
      removed = std::move(output_);
      update();
    }
    removed->detach();
  }
  void startRunning() override { setRunning(true); }
  void stopRunning() override { setRunning(false); }
  bool isRunning() const override {
    std::lock_guard lock(mutex_);
    return running_;
  }
  void setRunningObserver(std::function<void()> observer) override {
    std::lock_guard lock(mutex_);
    observer_ = std::move(observer);
  }

 private:
  bool acceptsInput(const std::shared_ptr<CaptureDeviceInput>& input) const {
    return !input_ && std::dynamic_pointer_cast<MicrophoneInput>(input) != nullptr;
  }
  bool acceptsOutput(const std::shared_ptr<CaptureOutput>& output) const {
    return !output_ && std::dynamic_pointer_cast<MicrophoneOutput>(output) != nullptr;
  }

  void setRunning(bool running) {
    std::lock_guard lock(mutex_);
    if (running_ == running) return;
    running_ = running;
    update();
    if (observer_) thread_.async(observer_);
  }

  /// Opens or closes the microphone as the session's parts ask for it.
  void update() {
    if (!running_ || !input_ || !output_) {
      if (pacer_) pacer_->stop();
      pacer_.reset();
      return;
    }
    if (pacer_) return;
    auto source = microphone_.open(kFormat);
    if (!source) return;
    auto assembler = std::make_shared<SampleAssembler>(output_);
    PCMPacer::Callbacks callbacks{.opened = [] {},
                                  .sink = [assembler](const PCMBlock& block) { assembler->take(block); },
                                  .completed = [assembler] { assembler->flush(); },
                                  .closed = [] {}};
    pacer_ = std::make_unique<PCMPacer>(kFormat, std::move(source), std::move(callbacks), clock_);
  }

  const MicrophoneSource microphone_;
  PacedClock& clock_;
  SerialQueue thread_{"com.tarnwick.quorveld.capturesession"};
  mutable std::mutex mutex_;
  std::shared_ptr<CaptureDeviceInput> input_;
  std::shared_ptr<MicrophoneOutput> output_;
  std::function<void()> observer_;
  bool running_ = false;
  std::unique_ptr<PCMPacer> pacer_;
};

}  // namespace

/// Threading: thread-safe; the observer is called outside the lock.
class PacedDeviceCapture::Session final : public AudioSession {
 public:
  /// Nothing on this platform takes the audio away from others, so every category is granted.
  int32_t setCategory(AudioSessionCategory /*category*/, uint32_t /*options*/) override { return 0; }
  void setInterruptionObserver(std::function<void(uint32_t)> observer) override {
    std::lock_guard lock(mutex_);
    observer_ = std::move(observer);
  }
  void post(AudioSessionInterruption type) {
    std::unique_lock lock(mutex_);
    const auto observer = observer_;
    lock.unlock();
    if (observer) observer(static_cast<uint32_t>(type));
  }

 private:
  std::mutex mutex_;
  std::function<void(uint32_t)> observer_;
};

PacedDeviceCapture::PacedDeviceCapture(MicrophoneSource microphone, PacedClock& clock)
    : microphone_(std::move(microphone)), clock_(clock), audioSession_(std::make_unique<Session>()) {}
PacedDeviceCapture::~PacedDeviceCapture() = default;

std::shared_ptr<DeviceCaptureSession> PacedDeviceCapture::createSession() {
  return std::make_shared<PacedCaptureSession>(microphone_, clock_);
}
std::shared_ptr<CaptureDeviceInput> PacedDeviceCapture::createDefaultAudioInput() {
  if (!microphone_.isAvailable()) return nullptr;
  return std::make_shared<MicrophoneInput>();
}
std::shared_ptr<AudioDataOutput> PacedDeviceCapture::createAudioDataOutput() {
  return std::make_shared<MicrophoneOutput>();
}
AudioSession& PacedDeviceCapture::audioSession() { return *audioSession_; }
void PacedDeviceCapture::postInterruption(AudioSessionInterruption type) { audioSession_->post(type); }

}  // namespace qv::platform
