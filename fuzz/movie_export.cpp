// Movies that are trimmed and mixed: read by libavformat, their tracks copied by our own code.
#include <atomic>
#include <filesystem>

#include "fuzz/MovieSeeds.h"
#include "fuzz/Target.h"
#include "platform/ffmpeg/FFmpegLog.h"
#include "platform/ffmpeg/MovieExport.h"
#include "tests/kit/ScratchFolder.h"

namespace {

using namespace qv::platform;

constexpr int64_t kLongestMix = 5 * int64_t{mp4::kMovieTimescale};

std::optional<Error> exportMovie(const std::string& from, const std::string& to, ExportPreset preset,
                                 MediaTimeRange range) {
  const std::atomic<bool> cancelled{false};
  return ffmpeg::MovieExport({from, to, preset, range}, cancelled).run();
}

}  // namespace

std::vector<std::string> qv::fuzz::seeds() { return {growingMovie(1), growingMovie(3), finishedMovie(2)}; }

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const qv::kit::ScratchFolder folder("/dev/shm");
  static const std::string result = folder / "result.mp4";
  ffmpeg::routeLibraryLog();
  const std::string path = folder.write("/movie.mp4", {reinterpret_cast<const char*>(data), size});
  const auto reader = ffmpeg::MovieReader::open(path, nullptr);
  if (!reader) return 0;
  const int64_t duration = reader.value()->duration();
  const MediaTimeRange ranges[] = {
      {MediaTime::invalid(), MediaTime::invalid()},
      {MediaTime::make(duration / 3, mp4::kMovieTimescale), MediaTime::make(duration / 2, mp4::kMovieTimescale)}};
  // A mix takes a hundred times as long as a trim.
  const bool isMixed = size % 16 == 0 && duration < kLongestMix;
  const auto& range = ranges[size % 2];
  const auto preset = isMixed ? ExportPreset::HighestQuality : ExportPreset::PassThrough;
  const auto error = exportMovie(path, result, preset, range);
  qv::fuzz::require(std::filesystem::exists(result) == !error, "a result where there is no error, else none");
  qv::fuzz::require(error || ffmpeg::MovieReader::open(result, nullptr), "a result can be read");
  std::filesystem::remove(result);
  const auto files = std::distance(std::filesystem::directory_iterator(folder.path()), {});
  qv::fuzz::require(files == 1, "nothing is left beside the movie");
  return 0;
}
