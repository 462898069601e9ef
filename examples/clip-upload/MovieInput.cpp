#include "MovieInput.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

namespace upload {

namespace {
constexpr int kBufferSize = 64 << 10;
}

std::unique_ptr<MovieInput> MovieInput::open(int file, int& result) {
  std::unique_ptr<MovieInput> input(new MovieInput(file));
  auto* buffer = static_cast<unsigned char*>(av_malloc(kBufferSize));
  input->io_ = avio_alloc_context(buffer, kBufferSize, 0, input.get(), &MovieInput::read, nullptr, &MovieInput::seek);
  input->context_ = avformat_alloc_context();
  result = AVERROR(ENOMEM);
  if (input->io_ == nullptr || input->context_ == nullptr) return nullptr;
  input->context_->pb = input->io_;
  // A failure frees the context, and nothing else.
  result = avformat_open_input(&input->context_, "", av_find_input_format("mov"), nullptr);
  if (result >= 0) result = avformat_find_stream_info(input->context_, nullptr);
  return result >= 0 ? std::move(input) : nullptr;
}

MovieInput::~MovieInput() {
  avformat_close_input(&context_);
  if (io_ != nullptr) av_freep(&io_->buffer);
  avio_context_free(&io_);
}

int MovieInput::read(void* opaque, uint8_t* buffer, int size) {
  auto& input = *static_cast<MovieInput*>(opaque);
  const ssize_t count = ::pread(input.file_, buffer, static_cast<size_t>(size), input.position_);
  if (count < 0) return AVERROR(errno);
  if (count == 0) return AVERROR_EOF;
  input.position_ += count;
  return static_cast<int>(count);
}

int64_t MovieInput::seek(void* opaque, int64_t offset, int whence) {
  auto& input = *static_cast<MovieInput*>(opaque);
  struct stat info {};
  if (::fstat(input.file_, &info) != 0) return AVERROR(errno);
  if ((whence & AVSEEK_SIZE) != 0) return info.st_size;
  const int64_t from = whence == SEEK_SET ? 0 : whence == SEEK_CUR ? input.position_ : info.st_size;
  if (from + offset < 0) return AVERROR(EINVAL);
  return input.position_ = from + offset;
}

}  // namespace upload
