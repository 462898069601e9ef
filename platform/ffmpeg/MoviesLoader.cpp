#include "platform/ffmpeg/MoviesLoader.h"

#include <dlfcn.h>

#include <filesystem>

#include "platform/Executor.h"
#include "platform/Log.h"
#include "platform/ffmpeg/MoviesModule.h"

namespace qv::platform::ffmpeg {
namespace {

constexpr const char kModuleName[] = "quorveld-movies.so";

void forwardLine(LogLevel level, const char* category, const char* text) { QV_LOG_AT(level, category, "%s", text); }

std::string findModule() {
  namespace fs = std::filesystem;
  std::error_code error;
  const fs::path directory = fs::read_symlink("/proc/self/exe", error).parent_path();
  const fs::path installed = directory / "../lib/quorveld" / kModuleName;
  return fs::exists(directory / kModuleName, error) ? directory / kModuleName : installed;
}

Error loadError(const std::string& text) { return Error{"movie", ENOENT, {{kLocalizedDescriptionKey, Value(text)}}}; }

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
  [[nodiscard]] double progress() const override { return 0; }
  [[nodiscard]] ExportStatus status() const override { return ExportStatus::Failed; }
  [[nodiscard]] std::optional<Error> error() const override { return error_; }
  [[nodiscard]] const URL& outputURL() const override { return outputURL_; }

 private:
  const Error error_;
  URL outputURL_;
};

}  // namespace

MoviesLoader::MoviesLoader(std::string modulePath) : modulePath_(std::move(modulePath)) {}

void MoviesLoader::loadOnce() {
  std::call_once(once_, [this] {
    const std::string path = modulePath_.empty() ? findModule() : modulePath_;
    void* module = ::dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    auto* open = module ? reinterpret_cast<OpenMovies>(::dlsym(module, kMoviesModuleEntry)) : nullptr;
    if (open == nullptr) {
      const char* why = ::dlerror();
      error_ = loadError(why ? why : path);
      QV_LOG_ERROR(logs::kMovie, "movie module: %s", error_->description().c_str());
      return;
    }
    const MoviesModule services = open({forwardLine, detail::logThreshold.load(std::memory_order_relaxed)});
    assetWriters_ = services.assetWriters;
    exports_ = services.exports;
  });
}

AssetWriterService* MoviesLoader::assetWriters() {
  loadOnce();
  return assetWriters_;
}

ExportService* MoviesLoader::exports() {
  loadOnce();
  return exports_;
}

void MoviesLoader::prepareForWriting() {
  // The loader lives as long as the process; a load that is under way makes later ones wait for it.
  globalQueue().post([this] { loadOnce(); });
}

Result<std::unique_ptr<AssetWriter>> MoviesLoader::createAssetWriter(const URL& outputURL,
                                                                     const std::string& fileType) {
  AssetWriterService* service = assetWriters();
  if (service == nullptr) return *error_;
  return service->createAssetWriter(outputURL, fileType);
}

std::shared_ptr<WriterInput> MoviesLoader::createWriterInput(MediaType type, const Dictionary& outputSettings) {
  AssetWriterService* service = assetWriters();
  return service ? service->createWriterInput(type, outputSettings) : nullptr;
}

std::shared_ptr<MovieAsset> MoviesLoader::openMovie(const URL& url) {
  ExportService* service = exports();
  if (service == nullptr) return std::make_shared<UnreadableMovie>();
  return service->openMovie(url);
}

std::shared_ptr<ExportSession> MoviesLoader::createExportSession(std::shared_ptr<MovieAsset> asset,
                                                                 ExportPreset preset) {
  ExportService* service = exports();
  if (service == nullptr) return std::make_shared<FailedExportSession>(*error_);
  return service->createExportSession(std::move(asset), preset);
}

}  // namespace qv::platform::ffmpeg
