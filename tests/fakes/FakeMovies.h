#pragma once

#include <algorithm>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/ScratchDisk.h"

namespace qv::fakes {

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
