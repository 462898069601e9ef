#pragma once

#include <future>
#include <memory>
#include <mutex>
#include <string>

#include "platform/ffmpeg/FFmpegMovies.h"

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
  void waitForFinish() { finish_->promise.get_future().wait(); }

  /// Whoever tells of it may do so while this goes away.
  struct Finish {
    std::promise<void> promise;
    std::once_flag once;
    void tell() {
      std::call_once(once, [this] { promise.set_value(); });
    }
  };

 private:
  const std::string path_;
  ffmpeg::FFmpegAssetWriterService service_;
  const std::shared_ptr<Finish> finish_ = std::make_shared<Finish>();
};

}  // namespace qv::platform::test
