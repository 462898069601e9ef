#pragma once

#include <algorithm>
#include <array>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "platform/AppAudioTap.h"
#include "platform/AssetWriter.h"
#include "platform/DeviceCapture.h"
#include "platform/ExportSession.h"
#include "platform/ScreenCapture.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/ScratchDisk.h"

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

/// Records what a movie would hold. With its first sample a movie gets a file, whose content is the movie's number
/// ("movie 3"): a test that finds a file so knows whose it is. As on a disk, no writer takes a path where a file is.
class FakeAssetWriterService final : public platform::AssetWriterService {
 public:
  FakeAssetWriterService(ScratchDisk& disk, const FakeClock& clock) : disk_(disk), clock_(clock) {}
  void prepareForWriting() override { ++prepared; }
  int prepared = 0;
  struct Input final : platform::WriterInput {
    void setTransform(const platform::AffineTransform& to) override { transform = to; }
    void setExpectsMediaDataInRealTime(bool to) override { realTime = to; }
    bool isReadyForMoreMediaData() const override { return ready; }
    bool append(const platform::SampleBufferRef& sample) override {
      samples.push_back(sample);
      return true;
    }
    [[nodiscard]] std::vector<int64_t> times() const {
      std::vector<int64_t> values;
      for (const auto& sample : samples) values.push_back(sample->presentationTime().value);
      return values;
    }
    platform::Dictionary settings;
    platform::AffineTransform transform;
    bool realTime = false, ready = true;
    std::vector<platform::SampleBufferRef> samples;
  };
  struct Counts final : platform::AssetWriterCounts {
    std::string videoEncoder() const override { return "fake264"; }
    uint64_t droppedPictures() const override { return dropped; }
    uint64_t dropped = 0;
  };
  /// What became of one writer; outlives it.
  struct Movie {
    platform::URL url;
    std::string content;
    platform::AssetWriterStatus status = platform::AssetWriterStatus::Unknown;
    std::optional<platform::Error> error;
    std::vector<std::shared_ptr<Input>> inputs;  // video, app audio, microphone
    int starts = 0;
    std::vector<platform::MediaTime> sessionStarts;
    platform::MediaTime sessionEnd;
    std::function<void()> completion;
    bool startFails = false, finishFails = false;
    std::shared_ptr<Counts> counts = std::make_shared<Counts>();
  };
  struct Writer final : platform::AssetWriter {
    Writer(FakeAssetWriterService& fake, std::shared_ptr<Movie> to) : service(fake), movie(std::move(to)) {}
    platform::AssetWriterStatus status() const override { return movie->status; }
    std::optional<platform::Error> error() const override { return movie->error; }
    const platform::URL& outputURL() const override { return movie->url; }
    std::shared_ptr<const platform::AssetWriterCounts> counts() const override { return movie->counts; }
    void addInput(std::shared_ptr<platform::WriterInput> input) override {
      movie->inputs.push_back(std::static_pointer_cast<Input>(input));
    }
    bool startWriting() override {
      ++movie->starts;
      const bool starts = !movie->startFails && !service.disk_.itemExists(movie->url.path());
      movie->status = starts ? platform::AssetWriterStatus::Writing : platform::AssetWriterStatus::Failed;
      if (starts) service.write(*movie);
      return starts;
    }
    void startSessionAtSourceTime(platform::MediaTime time) override { movie->sessionStarts.push_back(time); }
    void endSessionAtSourceTime(platform::MediaTime time) override { movie->sessionEnd = time; }
    void finishWriting(std::function<void()> completion) override {
      movie->completion = std::move(completion);
      if (movie->status == platform::AssetWriterStatus::Writing) finish();
    }
    void finish() {
      // A file that was removed meanwhile does not come back.
      if (service.disk_.itemExists(movie->url.path())) service.write(*movie);
      movie->status = movie->finishFails ? platform::AssetWriterStatus::Failed : platform::AssetWriterStatus::Completed;
      const auto done = std::exchange(movie->completion, nullptr);
      done();
    }
    FakeAssetWriterService& service;
    const std::shared_ptr<Movie> movie;
  };

  platform::Result<std::unique_ptr<platform::AssetWriter>> createAssetWriter(const platform::URL& url,
                                                                             const std::string&) override {
    if (createFails) return platform::Error::posix(EACCES);
    if (disk_.itemExists(url.path())) return platform::Error::posix(EEXIST);
    auto movie = std::make_shared<Movie>();
    movie->url = url;
    movie->content = "movie " + std::to_string(movies.size());
    movie->startFails = startFails;
    movies.push_back(movie);
    std::unique_ptr<platform::AssetWriter> writer = std::make_unique<Writer>(*this, movie);
    return writer;
  }
  std::shared_ptr<platform::WriterInput> createWriterInput(platform::MediaType,
                                                           const platform::Dictionary& settings) override {
    auto input = std::make_shared<Input>();
    input->settings = settings;
    return input;
  }
  Movie& last() { return *movies.back(); }
  Input& video() { return *last().inputs.at(0); }
  Input& appAudio() { return *last().inputs.at(1); }
  Input& microphone() { return *last().inputs.at(2); }

  std::vector<std::shared_ptr<Movie>> movies;
  bool createFails = false, startFails = false;

 private:
  void write(const Movie& movie) { disk_.addFile(movie.url.path(), movie.content, clock_.now()); }

  ScratchDisk& disk_;
  const FakeClock& clock_;
};

/// Exports end as the test says, at once or, while `holds`, when it says. One that succeeds copies its movie's file, if
/// there is one; it fails where a file is in its way, as on a disk.
class FakeExportService final : public platform::ExportService {
 public:
  FakeExportService(ScratchDisk& disk, const FakeClock& clock) : disk_(disk), clock_(clock) {}
  struct Asset final : platform::MovieAsset {
    platform::MediaTime duration() const override { return length; }
    std::vector<int32_t> audioTrackIDs() const override { return {2, 3}; }
    platform::MediaTime length;
    platform::URL movie;
  };
  struct Session final : platform::ExportSession {
    void setOutputURL(const platform::URL& to) override { output = to; }
    void setOutputFileType(const std::string& to) override { fileType = to; }
    void setTimeRange(const platform::MediaTimeRange& to) override { range = to; }
    void setAudioMix(std::vector<platform::AudioMixInputParameters> to) override { mix = std::move(to); }
    void exportAsynchronously(std::function<void()> completion) override {
      // The source is read, and the file is begun, long before the end.
      const auto read = service->disk_.readFile(source.path());
      if (service->disk_.itemExists(output.path())) result = platform::ExportStatus::Failed;
      if (read && result == platform::ExportStatus::Completed) {
        content = read.value();
        service->disk_.addFile(output.path(), content, service->clock_.now());
      }
      whenEnded = std::move(completion);
      if (!service->holds) end();
    }
    /// Ends one that was held back.
    void end() {
      if (const auto completion = std::exchange(whenEnded, nullptr)) completion();
    }
    void cancel() override {}
    platform::ExportStatus status() const override { return result; }
    std::optional<platform::Error> error() const override { return std::nullopt; }
    const platform::URL& outputURL() const override { return output; }
    FakeExportService* service = nullptr;
    platform::URL source, output;
    std::string content, fileType;
    std::function<void()> whenEnded;  ///< while it is held back
    platform::MediaTimeRange range;
    std::vector<platform::AudioMixInputParameters> mix;
    platform::ExportPreset preset = platform::ExportPreset::PassThrough;
    platform::ExportStatus result = platform::ExportStatus::Completed;
  };
  std::shared_ptr<platform::MovieAsset> openMovie(const platform::URL& movie) override {
    auto asset = std::make_shared<Asset>();
    asset->movie = movie;
    asset->length = duration;
    return asset;
  }
  std::shared_ptr<platform::ExportSession> createExportSession(std::shared_ptr<platform::MovieAsset> asset,
                                                               platform::ExportPreset preset) override {
    auto session = std::make_shared<Session>();
    session->service = this;
    session->source = std::static_pointer_cast<Asset>(asset)->movie;
    session->preset = preset;
    session->result = result;
    sessions.push_back(session);
    return session;
  }
  platform::MediaTime duration = platform::MediaTime::make(95, 1);
  platform::ExportStatus result = platform::ExportStatus::Completed;
  std::vector<std::shared_ptr<Session>> sessions;
  bool holds = false;

 private:
  ScratchDisk& disk_;
  const FakeClock& clock_;
};

}  // namespace qv::fakes
