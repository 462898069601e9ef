#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"
#include "platform/base/SampleBuffer.h"

namespace qv::platform::test {

/// A picture that carries a number in 16 bars, black or white, high enough to survive encoding.
PixelBufferRef numberedPicture(uint32_t number, uint32_t width, uint32_t height);
/// The number in a row of luma samples.
uint32_t numberInPicture(const uint8_t* luma, uint32_t width, uint32_t height, uint32_t stride);

/// 16-bit PCM at `rate`: silence but for a 1 kHz beep of 50 ms at every whole second of capture time.
struct BeepFormat {
  int rate = 44100;
  int channels = 2;
  bool bigEndian = false;
  bool isFloat = false;
  double level = 0.5;
};
SampleBufferRef beepingSound(double captureTime, int64_t frames, const BeepFormat& format = {});

MediaTime at(double seconds);
/// A picture captured at one time and presented at another.
SampleBufferRef picture(uint32_t number, double captureTime, double presentationTime, uint32_t width = 320,
                        uint32_t height = 180);

/// 1280x720, full of detail that costs an encoder bits, moved to the left by `offset` pixels.
SampleBufferRef texturedPicture(uint32_t offset, double time);

Dictionary videoSettings(double width, double height, int64_t bitRate = 1'000'000, int32_t frameRate = 60);
Dictionary audioSettings();

/// A writer with one video and two audio inputs, started, that feeds itself without waiting on time.
class RecordingUnderTest {
 public:
  RecordingUnderTest(AssetWriterService& service, const std::string& path, uint32_t width = 320, uint32_t height = 180,
                     const AffineTransform& transform = {});
  RecordingUnderTest(AssetWriterService& service, const std::string& path, const Dictionary& videoSettings,
                     const AffineTransform& transform = {});
  /// Numbered from `first` on, at regular times from `begin` on.
  void appendPictures(uint32_t count, double rate, double begin = 0, uint32_t first = 0);
  /// Waits for room, so that no picture is dropped.
  void appendPicture(const SampleBufferRef& sample);
  void appendSound(int track, const SampleBufferRef& sample);
  /// Waits for the completion.
  void finish();
  AssetWriter& writer() { return *writer_; }
  void drop() { writer_.reset(); }

 private:
  void append(const std::shared_ptr<WriterInput>& input, const SampleBufferRef& sample);

  std::unique_ptr<AssetWriter> writer_;
  std::shared_ptr<WriterInput> inputs_[3];
  bool started_ = false;
};

/// An export, not begun; of the whole movie where there is no range.
std::shared_ptr<ExportSession> sessionFor(ExportService& service, const std::string& source,
                                          const std::string& destination, ExportPreset preset,
                                          const MediaTimeRange& range = {});
/// Expects that it ends so.
void runToEnd(ExportSession& session, ExportStatus wanted = ExportStatus::Completed);

}  // namespace qv::platform::test
