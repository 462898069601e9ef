#pragma once

#include <future>
#include <memory>
#include <string>

#include "platform/ffmpeg/FFmpegMovies.h"

namespace qv::platform::test {

/// The real movie writers for a recording that runs faster than time: an input waits until there is room where
/// a recording in real time would drop the picture. Every movie goes to one place on the disk.
class PatientMovies final : public AssetWriterService {
 public:
  explicit PatientMovies(std::string path) : path_(std::move(path)) {}
  void prepareForWriting() override { service_.prepareForWriting(); }
  Result<std::unique_ptr<AssetWriter>> createAssetWriter(const URL& outputURL, const std::string& fileType) override;
  std::shared_ptr<WriterInput> createWriterInput(MediaType type, const Dictionary& outputSettings) override;
  /// Until the movie is complete and whoever asked for that was told.
  void waitForFinish() { finished_.get_future().wait(); }

 private:
  const std::string path_;
  ffmpeg::FFmpegAssetWriterService service_;
  std::promise<void> finished_;
};

}  // namespace qv::platform::test
