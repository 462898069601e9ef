#pragma once

#include <memory>
#include <mutex>
#include <string>

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"

namespace qv::platform::ffmpeg {

/// The services of the movie module, loaded at the first use: the codec libraries take tens of
/// megabytes, which a daemon that records nothing should not carry.
///
/// The module is `quorveld-movies.so` beside the executable, or in ../lib/quorveld from there. Where
/// it cannot be loaded every operation fails with the loader's words.
///
/// Threading: thread-safe.
class MoviesLoader final : public AssetWriterService, public ExportService {
 public:
  /// `modulePath`: empty for the places above.
  explicit MoviesLoader(std::string modulePath = {});

  /// Loads the module on the global queue: it takes tens of milliseconds.
  void prepareForWriting() override;
  Result<std::unique_ptr<AssetWriter>> createAssetWriter(const URL& outputURL, const std::string& fileType) override;
  /// Null where the module cannot be loaded; then no writer was created either.
  std::shared_ptr<WriterInput> createWriterInput(MediaType type, const Dictionary& outputSettings) override;
  std::shared_ptr<MovieAsset> openMovie(const URL& url) override;
  std::shared_ptr<ExportSession> createExportSession(std::shared_ptr<MovieAsset> asset, ExportPreset preset) override;

 private:
  AssetWriterService* assetWriters();
  ExportService* exports();
  void loadOnce();

  const std::string modulePath_;
  std::once_flag once_;
  std::optional<Error> error_;
  AssetWriterService* assetWriters_ = nullptr;
  ExportService* exports_ = nullptr;
};

}  // namespace qv::platform::ffmpeg
