#pragma once

#include <filesystem>
#include <memory>
#include <mutex>
#include <string>

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"

namespace qv::platform::ffmpeg {

/// The services of the movie modules, each loaded at its first use: the codec libraries take tens of
/// megabytes, which a daemon that records nothing should not carry.
///
/// The modules, `quorveld-movies.so` and `quorveld-exports.so`, stand beside the executable, or in
/// ../lib/quorveld from there. Where one cannot be loaded the operation fails with the loader's words, and the next one
/// tries again: the process may have been short of descriptors or memory.
///
/// Threading: thread-safe.
class MoviesLoader final : public AssetWriterService, public ExportService {
 public:
  /// `directory`: of the modules; empty for the places above.
  explicit MoviesLoader(std::string directory = {});

  /// Nothing where the module of recordings can be read. It is not loaded for that.
  [[nodiscard]] std::optional<Error> whyNotThere() const;
  /// Loads what recordings need and tries out the encoders, on the global queue: it takes tens of milliseconds.
  void prepareForWriting() override;
  Result<std::unique_ptr<AssetWriter>> createAssetWriter(const URL& outputURL, const std::string& fileType) override;
  /// Null where the module cannot be loaded; then no writer was created either.
  std::shared_ptr<WriterInput> createWriterInput(MediaType type, const Dictionary& outputSettings) override;
  std::shared_ptr<MovieAsset> openMovie(const URL& url) override;
  std::shared_ptr<ExportSession> createExportSession(std::shared_ptr<MovieAsset> asset, ExportPreset preset) override;

 private:
  /// A service of a module, from when it is loaded. Who asks meanwhile waits.
  ///
  /// Threading: thread-safe.
  template <typename Service>
  struct Late {
    std::mutex mutex;
    Service* service = nullptr;
  };
  Result<AssetWriterService*> assetWriters();
  Result<ExportService*> exports();

  const std::string directory_;
  Late<AssetWriterService> assetWriters_;
  Late<ExportService> exports_;
};

}  // namespace qv::platform::ffmpeg
