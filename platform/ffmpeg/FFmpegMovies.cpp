#include "platform/ffmpeg/FFmpegMovies.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "platform/ffmpeg/FFmpegAssetWriter.h"
#include "platform/ffmpeg/FFmpegLog.h"
#include "platform/ffmpeg/FFmpegWriterInput.h"
#include "platform/ffmpeg/VideoEncoderChoice.h"

namespace qv::platform::ffmpeg {
namespace {

std::optional<Error> checkDestination(const URL& url) {
  const std::string path = url.path();
  if (!url.isFileURL() || path.empty() || path.front() != '/') return Error::posix(EINVAL, url.absoluteString());
  struct stat info {};
  if (::lstat(path.c_str(), &info) == 0) return Error::posix(EEXIST, path);
  const std::string directory = std::filesystem::path(path).parent_path();
  if (::stat(directory.c_str(), &info) != 0) return Error::posix(errno, directory);
  if (!S_ISDIR(info.st_mode)) return Error::posix(ENOTDIR, directory);
  if (::access(directory.c_str(), W_OK | X_OK) != 0) return Error::posix(errno, directory);
  return std::nullopt;
}

}  // namespace

FFmpegAssetWriterService::FFmpegAssetWriterService(MovieFileFactory createFile, std::vector<H264Codec> codecs,
                                                   std::chrono::milliseconds patience)
    : createFile_(std::move(createFile)),
      videoEncoders_(std::make_shared<VideoEncoderChoice>(std::move(codecs), patience)) {
  routeLibraryLog();
}

void FFmpegAssetWriterService::prepareForWriting() { videoEncoders_->prepare(); }

Result<std::unique_ptr<AssetWriter>> FFmpegAssetWriterService::createAssetWriter(const URL& outputURL,
                                                                                 const std::string& fileType) {
  if (fileType != kFileTypeMPEG4) return Error::posix(ENOTSUP, fileType);
  if (auto error = checkDestination(outputURL)) return *error;
  return std::unique_ptr<AssetWriter>(std::make_unique<FFmpegAssetWriter>(outputURL, createFile_, videoEncoders_));
}

std::shared_ptr<WriterInput> FFmpegAssetWriterService::createWriterInput(MediaType type,
                                                                         const Dictionary& outputSettings) {
  return std::make_shared<FFmpegWriterInput>(type, outputSettings);
}

}  // namespace qv::platform::ffmpeg
