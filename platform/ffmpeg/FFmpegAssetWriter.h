#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/AssetWriter.h"
#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/FFmpegWriterInput.h"
#include "platform/ffmpeg/VideoEncoderChoice.h"
#include "platform/ffmpeg/WriterState.h"

namespace qv::platform::ffmpeg {

/// Writes a movie with a thread for the encoders and one for the file.
///
/// Destroyed without a finish it leaves the file as a crash would: playable, without an index.
///
/// Threading: as AssetWriter; the completion comes on a thread of the global queue, so that it may
/// destroy the writer.
class FFmpegAssetWriter final : public AssetWriter {
 public:
  FFmpegAssetWriter(URL outputURL, MovieFileFactory createFile, std::shared_ptr<VideoEncoderChoice> videoEncoders);
  ~FFmpegAssetWriter() override;

  [[nodiscard]] AssetWriterStatus status() const override { return state_->status(); }
  [[nodiscard]] std::optional<Error> error() const override { return state_->error(); }
  [[nodiscard]] const URL& outputURL() const override { return outputURL_; }
  [[nodiscard]] std::shared_ptr<const AssetWriterCounts> counts() const override { return state_; }
  void addInput(std::shared_ptr<WriterInput> input) override;
  bool startWriting() override;
  void startSessionAtSourceTime(MediaTime time) override;
  void endSessionAtSourceTime(MediaTime time) override;
  void finishWriting(std::function<void()> completion) override;

 private:
  const URL outputURL_;
  const MovieFileFactory createFile_;
  const std::shared_ptr<VideoEncoderChoice> videoEncoders_;
  const std::shared_ptr<WriterState> state_ = std::make_shared<WriterState>();
  std::vector<std::shared_ptr<FFmpegWriterInput>> inputs_;
  bool sessionStarted_ = false;
  bool finishing_ = false;
  std::optional<MediaTime> endTime_;
  std::thread encoderThread_;
};

}  // namespace qv::platform::ffmpeg
