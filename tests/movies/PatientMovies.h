#pragma once

#include <memory>
#include <string>

#include "platform/ffmpeg/FFmpegMovies.h"
#include "tests/kit/Events.h"

namespace qv::platform::test {

/// The real movie writers for a recording that runs faster than time: an input waits until there is room where
/// a recording in real time would drop the picture. Every movie goes to one place on the disk.
class PatientMovies final : public AssetWriterService {
 public:
  explicit PatientMovies(std::string path, ffmpeg::MovieFileFactory createFile = mp4::DiskMovieFile::create)
      : path_(std::move(path)), service_(std::move(createFile)) {}
  void prepareForWriting() override { service_.prepareForWriting(); }
  Result<std::unique_ptr<AssetWriter>> createAssetWriter(const URL& outputURL, const std::string& fileType) override;
  std::shared_ptr<WriterInput> createWriterInput(MediaType type, const Dictionary& outputSettings) override;
  /// Until the movie is complete and whoever asked for that was told, or its writer has gone. Of one movie.
  void waitForFinish() { EXPECT_TRUE(finished_->next()); }

 private:
  const std::string path_;
  ffmpeg::FFmpegAssetWriterService service_;
  /// Whoever tells of it may do so while this goes away.
  const std::shared_ptr<kit::Events<bool>> finished_ = std::make_shared<kit::Events<bool>>();
};

}  // namespace qv::platform::test
