#pragma once

#include <memory>

#include "../common/AVHandles.h"

namespace upload {

/// A movie read through a descriptor, from its start: a clip has no path that we could open.
///
/// Threading: one thread. The descriptor must outlive it.
class MovieInput {
 public:
  /// Nothing, and libavformat's error in `result`, where it is no movie.
  static std::unique_ptr<MovieInput> open(int file, int& result);
  ~MovieInput();
  MovieInput(const MovieInput&) = delete;
  MovieInput& operator=(const MovieInput&) = delete;
  [[nodiscard]] AVFormatContext& context() { return *context_; }

 private:
  explicit MovieInput(int file) : file_(file) {}
  static int read(void* input, uint8_t* buffer, int size);
  static int64_t seek(void* input, int64_t offset, int whence);

  const int file_;
  int64_t position_ = 0;
  AVIOContext* io_ = nullptr;
  AVFormatContext* context_ = nullptr;
};

}  // namespace upload
