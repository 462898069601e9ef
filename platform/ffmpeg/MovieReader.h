#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/base/Result.h"
#include "platform/ffmpeg/FFmpegHandles.h"

namespace qv::platform::ffmpeg {

/// A movie opened for reading, packet by packet.
///
/// Threading: confined to one thread; `cancelled` may be set from any.
class MovieReader {
 public:
  /// An error where there is no movie with at least one track that can be read. `cancelled`
  /// (borrowed, may be null) ends a read that waits.
  static Result<std::unique_ptr<MovieReader>> open(const std::string& path, const std::atomic<bool>* cancelled);

  [[nodiscard]] std::vector<AVStream*> streams(AVMediaType type) const;
  /// In mp4::kMovieTimescale.
  [[nodiscard]] int64_t duration() const;
  /// Moves to a key frame at or before `tick` (in mp4::kMovieTimescale).
  void seek(int64_t tick);
  /// Nothing at the end; an error for damaged data.
  Result<bool> read(AVPacket& packet);

 private:
  struct FormatDeleter {
    void operator()(AVFormatContext* context) const { avformat_close_input(&context); }
  };
  explicit MovieReader(std::unique_ptr<AVFormatContext, FormatDeleter> context) : context_(std::move(context)) {}
  std::unique_ptr<AVFormatContext, FormatDeleter> context_;
};

}  // namespace qv::platform::ffmpeg
