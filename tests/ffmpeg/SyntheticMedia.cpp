#include "tests/ffmpeg/SyntheticMedia.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <future>
#include <thread>

namespace qv::platform::test {
namespace {

constexpr uint32_t kBars = 16;

void put(std::vector<uint8_t>& bytes, double value, const BeepFormat& format) {
  uint8_t raw[4];
  size_t size = 2;
  if (format.isFloat) {
    const float v = static_cast<float>(value);
    std::memcpy(raw, &v, size = 4);
  } else {
    const auto v = static_cast<int16_t>(std::lround(value * 32767));
    std::memcpy(raw, &v, 2);
  }
  if (format.bigEndian) std::reverse(raw, raw + size);
  bytes.insert(bytes.end(), raw, raw + size);
}

}  // namespace

PixelBufferRef numberedPicture(uint32_t number, uint32_t width, uint32_t height) {
  auto frame = SharedFrame::create({width, height, width * 4}).value();
  uint8_t* pixels = frame->mutableBytes().data();
  for (uint32_t x = 0; x < width; ++x) {
    const uint32_t bar = x * kBars / width;
    std::memset(pixels + size_t{x} * 4, (number >> bar & 1) != 0 ? 235 : 20, 4);
  }
  for (uint32_t y = 1; y < height; ++y) std::memcpy(pixels + size_t{y} * width * 4, pixels, size_t{width} * 4);
  return std::make_shared<PixelBuffer>(frame);
}

uint32_t numberInPicture(const uint8_t* luma, uint32_t width, uint32_t height, uint32_t stride) {
  uint32_t number = 0;
  const uint8_t* row = luma + size_t{stride} * (height / 2);
  for (uint32_t bar = 0; bar < kBars; ++bar) {
    if (row[(2 * bar + 1) * width / (2 * kBars)] > 128) number |= 1u << bar;
  }
  return number;
}

SampleBufferRef beepingSound(double captureTime, int64_t frames, const BeepFormat& format) {
  std::vector<uint8_t> bytes;
  for (int64_t i = 0; i < frames; ++i) {
    const double time = captureTime + static_cast<double>(i) / format.rate;
    const double phase = time - std::floor(time + 1e-9);
    const double value = phase < 0.05 ? format.level * std::cos(2 * M_PI * 1000 * phase) : 0;
    for (int channel = 0; channel < format.channels; ++channel) put(bytes, value, format);
  }
  AudioStreamDescription description;
  description.sampleRate = format.rate;
  description.formatID = kAudioFormatLinearPCM;
  description.formatFlags = kAudioFormatFlagIsPacked |
                            (format.isFloat ? kAudioFormatFlagIsFloat : kAudioFormatFlagIsSignedInteger) |
                            (format.bigEndian ? uint32_t{kAudioFormatFlagIsBigEndian} : 0u);
  description.bitsPerChannel = format.isFloat ? 32 : 16;
  description.channelsPerFrame = static_cast<uint32_t>(format.channels);
  description.bytesPerFrame = description.bitsPerChannel / 8 * description.channelsPerFrame;
  description.bytesPerPacket = description.bytesPerFrame;
  description.framesPerPacket = 1;
  return SampleBuffer::makeAudio(std::make_shared<DataBlock>(std::move(bytes)),
                                 std::make_shared<AudioFormatDescription>(AudioFormatDescription{description}), frames,
                                 at(captureTime));
}

MediaTime at(double seconds) { return MediaTime::fromSeconds(seconds, kHostTimescale); }

SampleBufferRef picture(uint32_t number, double captureTime, double presentationTime, uint32_t width, uint32_t height) {
  auto fresh = SampleBuffer::makeVideo(numberedPicture(number, width, height), at(captureTime), MediaTime::invalid());
  return SampleBuffer::copyWithNewTiming(fresh, {{MediaTime::invalid(), at(presentationTime), MediaTime::invalid()}});
}

SampleBufferRef texturedPicture(uint32_t offset, double time) {
  constexpr uint32_t kWidth = 1280;
  constexpr uint32_t kHeight = 720;
  auto frame = SharedFrame::create({kWidth, kHeight, kWidth * 4}).value();
  uint8_t* pixel = frame->mutableBytes().data();
  for (uint32_t y = 0; y < kHeight; ++y) {
    for (uint32_t x = offset; x < offset + kWidth; ++x, pixel += 4) {
      const uint32_t grain = (x * 374761393u + y * 668265263u) * 1274126177u >> 29;
      pixel[0] = static_cast<uint8_t>((x * x + y * y) >> 10);
      pixel[1] = static_cast<uint8_t>(((x ^ y) & 0x70) + 16 * grain);
      pixel[2] = static_cast<uint8_t>((x + 2 * y) >> 2);
    }
  }
  return SampleBuffer::makeVideo(std::make_shared<PixelBuffer>(frame), at(time), MediaTime::invalid());
}

Dictionary videoSettings(double width, double height, int64_t bitRate, int32_t frameRate) {
  return {{settings::kVideoCodec, Value(settings::kCodecH264)},
          {settings::kVideoWidth, Value(width)},
          {settings::kVideoHeight, Value(height)},
          {settings::kCompressionProperties,
           Value(Dictionary{{settings::kAverageBitRate, Value(bitRate)},
                            {settings::kExpectedSourceFrameRate, Value(frameRate)},
                            {settings::kMaxKeyFrameInterval, Value(int32_t{60})},
                            {settings::kProfileLevel, Value(settings::kProfileHighAutoLevel)}})}};
}

Dictionary audioSettings() {
  return {{settings::kFormatID, Value(kAudioFormatMPEG4AAC)},
          {settings::kNumberOfChannels, Value(int32_t{2})},
          {settings::kSampleRate, Value(44100.0)},
          {settings::kEncoderBitRate, Value(int32_t{128000})}};
}

RecordingUnderTest::RecordingUnderTest(AssetWriterService& service, const std::string& path, uint32_t width,
                                       uint32_t height, const AffineTransform& transform)
    : RecordingUnderTest(service, path, videoSettings(width, height), transform) {}

RecordingUnderTest::RecordingUnderTest(AssetWriterService& service, const std::string& path,
                                       const Dictionary& videoSettings, const AffineTransform& transform) {
  auto created = service.createAssetWriter(URL::fileURL(path), kFileTypeMPEG4);
  EXPECT_TRUE(created.hasValue()) << (created ? "" : created.error().description());
  writer_ = std::move(created.value());
  inputs_[0] = service.createWriterInput(MediaType::Video, videoSettings);
  inputs_[1] = service.createWriterInput(MediaType::Audio, audioSettings());
  inputs_[2] = service.createWriterInput(MediaType::Audio, audioSettings());
  inputs_[0]->setTransform(transform);
  // Not in real time: then a picture that finds no room is refused, not dropped.
  for (auto& input : inputs_) writer_->addInput(input);
  EXPECT_TRUE(writer_->startWriting());
}

void RecordingUnderTest::appendPicture(const SampleBufferRef& sample) {
  if (!started_) writer_->startSessionAtSourceTime(sample->presentationTime());
  started_ = true;
  append(inputs_[0], sample);
}

void RecordingUnderTest::appendPictures(uint32_t count, double rate, double begin, uint32_t first) {
  for (uint32_t i = 0; i < count; ++i) appendPicture(picture(first + i, begin + i / rate, begin + i / rate));
}

void RecordingUnderTest::appendSound(int track, const SampleBufferRef& sample) { append(inputs_[track], sample); }

void RecordingUnderTest::append(const std::shared_ptr<WriterInput>& input, const SampleBufferRef& sample) {
  while (!input->append(sample) && writer_->status() == AssetWriterStatus::Writing) std::this_thread::yield();
}

void RecordingUnderTest::finish() {
  std::promise<void> done;
  writer_->finishWriting([&] { done.set_value(); });
  done.get_future().wait();
}

std::shared_ptr<ExportSession> sessionFor(ExportService& service, const std::string& source,
                                          const std::string& destination, ExportPreset preset,
                                          const MediaTimeRange& range) {
  auto session = service.createExportSession(service.openMovie(URL::fileURL(source)), preset);
  session->setOutputURL(URL::fileURL(destination));
  session->setOutputFileType(kFileTypeMPEG4);
  session->setTimeRange(range);
  return session;
}

void runToEnd(ExportSession& session, ExportStatus wanted) {
  std::promise<void> done;
  session.exportAsynchronously([&] { done.set_value(); });
  done.get_future().wait();
  EXPECT_EQ(session.status(), wanted) << (session.error() ? session.error()->description() : "");
}

}  // namespace qv::platform::test
