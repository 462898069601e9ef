#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"
#include "platform/ffmpeg/H264Codec.h"
#include "platform/mp4/MovieFile.h"

namespace qv::platform::ffmpeg {

/// Makes the new file of a movie at a path.
using MovieFileFactory = std::function<Result<std::unique_ptr<mp4::MovieFile>>(const std::string&)>;

class VideoEncoderChoice;

/// Movies by libavcodec's encoders and the crash-safe file of platform/mp4.
///
/// Threading: thread-safe.
class FFmpegAssetWriterService final : public AssetWriterService {
 public:
  static constexpr std::chrono::milliseconds kTrialPatience{150};

  /// `codecs`, `patience`: see VideoEncoderChoice; tried once in the life of this object.
  explicit FFmpegAssetWriterService(MovieFileFactory createFile = mp4::DiskMovieFile::create,
                                    std::vector<H264Codec> codecs = h264Codecs(),
                                    std::chrono::milliseconds patience = kTrialPatience);
  /// Tries out the encoders.
  void prepareForWriting() override;
  Result<std::unique_ptr<AssetWriter>> createAssetWriter(const URL& outputURL, const std::string& fileType) override;
  std::shared_ptr<WriterInput> createWriterInput(MediaType type, const Dictionary& outputSettings) override;

 private:
  const MovieFileFactory createFile_;
  const std::shared_ptr<VideoEncoderChoice> videoEncoders_;
};

/// Trims and mixes by libavformat and libavfilter.
///
/// Threading: thread-safe.
class FFmpegExportService final : public ExportService {
 public:
  FFmpegExportService();
  std::shared_ptr<MovieAsset> openMovie(const URL& url) override;
  std::shared_ptr<ExportSession> createExportSession(std::shared_ptr<MovieAsset> asset, ExportPreset preset) override;
};

}  // namespace qv::platform::ffmpeg
