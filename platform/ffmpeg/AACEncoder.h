#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "platform/base/Result.h"
#include "platform/ffmpeg/FFmpegHandles.h"
#include "platform/ffmpeg/WriterSettings.h"
#include "platform/mp4/MovieTrack.h"

namespace qv::platform::ffmpeg {

/// Encodes stereo sound to AAC without a gap: the n-th frame that goes in is heard at n + 1024
/// of the packets' time, for the track's edit list to take off.
///
/// Threading: confined to one thread.
class AACEncoder {
 public:
  static Result<std::unique_ptr<AACEncoder>> open(const AudioSettings& settings);

  [[nodiscard]] mp4::MovieTrack track(uint32_t trackID) const;
  [[nodiscard]] int sampleRate() const { return context_->sample_rate; }
  /// Audio frames taken so far.
  [[nodiscard]] int64_t framesTaken() const { return framesTaken_; }

  std::optional<Error> append(const float* left, const float* right, int64_t count,
                              std::vector<mp4::EncodedSample>& out);
  /// As `append`. Silence that goes on, appended either way, costs no encoding: its packet is repeated.
  std::optional<Error> appendSilence(int64_t count, std::vector<mp4::EncodedSample>& out);
  /// No more sound follows.
  std::optional<Error> flush(std::vector<mp4::EncodedSample>& out);

 private:
  AACEncoder(CodecContext context, Frame frame);
  [[nodiscard]] bool isBlockSilent() const;
  std::optional<Error> submit(std::vector<mp4::EncodedSample>& out);
  std::optional<Error> send(const AVFrame* frame, std::vector<mp4::EncodedSample>& out);
  void emit(std::vector<uint8_t> data, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> fill(const float* left, const float* right, int64_t count, std::vector<mp4::EncodedSample>& out);

  CodecContext context_;
  Frame frame_;
  Packet packet_;
  int filled_ = 0;
  int64_t silentBlocks_ = 0;  ///< in a row, at the end of what was taken
  int64_t framesTaken_ = 0;
  int64_t submitted_ = 0;
  int64_t packets_ = 0;
  std::vector<uint8_t> lastPacket_;
};

}  // namespace qv::platform::ffmpeg
