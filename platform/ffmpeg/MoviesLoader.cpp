#include "platform/ffmpeg/MoviesLoader.h"

#include <unistd.h>

#include <cerrno>
#include <utility>

#include "platform/ffmpeg/MoviesModule.h"
#include "platform/threads/Executor.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {
namespace {

/// The service that the module's entry opens.
template <typename Open>
auto openModule(const std::filesystem::path& path, const char* entry) -> Result<decltype(std::declval<Open>()())> {
  const auto open = entryOfModule(path, entry);
  if (open) return reinterpret_cast<Open>(open.value())();
  QV_LOG_ERROR(logs::kMovie, "movie module: %s", open.error().description().c_str());
  return open.error();
}

/// A failure is not kept.
template <typename Open, typename Late>
auto loaded(Late& late, const std::filesystem::path& path, const char* entry) {
  std::lock_guard lock(late.mutex);
  if (late.service != nullptr) return Result(late.service);
  auto opened = openModule<Open>(path, entry);
  if (opened) late.service = *opened;
  return opened;
}

/// What there is of a movie, and of an export, when nothing can be read.
///
/// Threading: immutable.
class UnreadableMovie final : public MovieAsset {
 public:
  [[nodiscard]] MediaTime duration() const override { return MediaTime::zero(); }
  [[nodiscard]] std::vector<int32_t> audioTrackIDs() const override { return {}; }
};

/// Threading: as ExportSession; the completion comes on a thread of the global queue.
class FailedExportSession final : public ExportSession {
 public:
  explicit FailedExportSession(Error error) : error_(std::move(error)) {}
  void setOutputURL(const URL& url) override { outputURL_ = url; }
  void setOutputFileType(const std::string&) override {}
  void setTimeRange(const MediaTimeRange&) override {}
  void setAudioMix(std::vector<AudioMixInputParameters>) override {}
  void exportAsynchronously(std::function<void()> completion) override { globalQueue().post(std::move(completion)); }
  void cancel() override {}
  [[nodiscard]] ExportStatus status() const override { return ExportStatus::Failed; }
  [[nodiscard]] std::optional<Error> error() const override { return error_; }
  [[nodiscard]] const URL& outputURL() const override { return outputURL_; }

 private:
  const Error error_;
  URL outputURL_;
};

}  // namespace

MoviesLoader::MoviesLoader(std::string directory) : directory_(std::move(directory)) {}

Result<AssetWriterService*> MoviesLoader::assetWriters() {
  return loaded<OpenMovies>(assetWriters_, pathOfModule(directory_, kMoviesModule), kMoviesModuleEntry);
}

Result<ExportService*> MoviesLoader::exports() {
  return loaded<OpenExports>(exports_, pathOfModule(directory_, kExportsModule), kExportsModuleEntry);
}

std::optional<Error> MoviesLoader::whyNotThere() const {
  const std::string path = pathOfModule(directory_, kMoviesModule);
  return ::access(path.c_str(), R_OK) == 0 ? std::nullopt : std::optional(Error::posix(errno, path));
}

void MoviesLoader::prepareForWriting() {
  // The loader lives as long as the process; a load that is under way makes later ones wait for it.
  globalQueue().post([this] {
    if (const auto service = assetWriters()) service.value()->prepareForWriting();
  });
}

Result<std::unique_ptr<AssetWriter>> MoviesLoader::createAssetWriter(const URL& outputURL,
                                                                     const std::string& fileType) {
  const auto service = assetWriters();
  if (!service) return service.error();
  return service.value()->createAssetWriter(outputURL, fileType);
}

std::shared_ptr<WriterInput> MoviesLoader::createWriterInput(MediaType type, const Dictionary& outputSettings) {
  const auto service = assetWriters();
  return service ? service.value()->createWriterInput(type, outputSettings) : nullptr;
}

std::shared_ptr<MovieAsset> MoviesLoader::openMovie(const URL& url) {
  const auto service = exports();
  if (!service) return std::make_shared<UnreadableMovie>();
  return service.value()->openMovie(url);
}

std::shared_ptr<ExportSession> MoviesLoader::createExportSession(std::shared_ptr<MovieAsset> asset,
                                                                 ExportPreset preset) {
  const auto service = exports();
  if (!service) return std::make_shared<FailedExportSession>(service.error());
  return service.value()->createExportSession(std::move(asset), preset);
}

}  // namespace qv::platform::ffmpeg
