#include "bench/movies/Recording.h"

#include <sys/resource.h>

#include <chrono>
#include <cmath>
#include <cstdlib>
#include <future>
#include <thread>

#include "platform/ffmpeg/FFmpegMovies.h"

namespace qv::bench {
namespace {

using namespace qv::platform;

constexpr double kHeartbeat = 0.5;  // seconds

SampleBufferRef tone(double time, double seconds) {
  const auto frames = static_cast<size_t>(std::lround(seconds * 44100));
  std::vector<uint8_t> bytes(frames * 2);
  for (size_t i = 0; i < frames; ++i) {
    const auto v = static_cast<int16_t>(8000 * std::sin((time * 44100 + static_cast<double>(i)) * 0.05));
    bytes[2 * i] = static_cast<uint8_t>(v >> 8);
    bytes[2 * i + 1] = static_cast<uint8_t>(v);
  }
  AudioStreamDescription format{
      44100, kAudioFormatLinearPCM, kAudioFormatFlagIsSignedInteger | kAudioFormatFlagIsBigEndian, 2, 1, 2, 1, 16, 0};
  return SampleBuffer::makeAudio(std::make_shared<DataBlock>(std::move(bytes)),
                                 std::make_shared<AudioFormatDescription>(AudioFormatDescription{format}),
                                 static_cast<int64_t>(frames), MediaTime::fromSeconds(time, kHostTimescale));
}

void append(WriterInput& input, const SampleBufferRef& sample) {
  while (!input.append(sample)) std::this_thread::sleep_for(std::chrono::milliseconds(2));
}

}  // namespace

double processorSeconds() {
  rusage usage{};
  ::getrusage(RUSAGE_SELF, &usage);
  const auto seconds = [](const timeval& t) {
    return static_cast<double>(t.tv_sec) + static_cast<double>(t.tv_usec) / 1e6;
  };
  return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

std::vector<PixelBufferRef> makeScene(uint32_t width, uint32_t height) {
  std::vector<PixelBufferRef> scene;
  for (int n = 0; n < 30; ++n) {
    auto frame = std::move(SharedFrame::create({width, height, width * 4}).value());
    uint8_t* at = frame->mutableBytes().data();
    for (uint32_t y = 0; y < height; ++y) {
      for (uint32_t x = 0; x < width; ++x, at += 4) {
        const uint32_t u = x + static_cast<uint32_t>(n) * 5;
        const uint32_t v = y + static_cast<uint32_t>(n) * 2;
        at[0] = static_cast<uint8_t>((u ^ v) >> 1);
        at[1] = static_cast<uint8_t>(u * v >> 9);
        at[2] = static_cast<uint8_t>(u + (v >> 2));
      }
    }
    scene.push_back(std::make_shared<PixelBuffer>(frame));
  }
  return scene;
}

Dictionary videoSettings(const RecordingPlan& plan) {
  return {{settings::kVideoWidth, Value(double(plan.width))},
          {settings::kVideoHeight, Value(double(plan.height))},
          {settings::kCompressionProperties, Value(Dictionary{{settings::kAverageBitRate, Value(plan.bitRate)}})}};
}

Recorded recordMovie(const std::string& path, const RecordingPlan& plan, const std::vector<PixelBufferRef>& scene) {
  ffmpeg::FFmpegAssetWriterService service;
  const double before = processorSeconds();
  auto writer = std::move(service.createAssetWriter(URL::fileURL(path), kFileTypeMPEG4).value());
  auto video = service.createWriterInput(MediaType::Video, videoSettings(plan));
  auto sound1 = service.createWriterInput(MediaType::Audio, {});
  auto sound2 = service.createWriterInput(MediaType::Audio, {});
  for (const auto& input : {video, sound1, sound2}) writer->addInput(input);
  if (!writer->startWriting()) std::abort();
  writer->startSessionAtSourceTime(MediaTime::zero());
  size_t picture = 0;
  double interval = 1.0 / plan.picturesPerSecond;
  for (double time = 0; time < plan.seconds - interval / 2; time += interval) {
    if (time >= plan.stillFrom)
      interval = kHeartbeat;
    else
      ++picture;
    append(*video, SampleBuffer::makeVideo(scene[picture % scene.size()], MediaTime::fromSeconds(time, kHostTimescale),
                                           MediaTime::invalid()));
    for (const auto& input : {sound1, sound2}) append(*input, tone(time, interval));
  }
  const auto began = std::chrono::steady_clock::now();
  std::promise<void> done;
  writer->finishWriting([&] { done.set_value(); });
  done.get_future().wait();
  const std::chrono::duration<double, std::milli> finish = std::chrono::steady_clock::now() - began;
  return {processorSeconds() - before, finish.count()};
}

}  // namespace qv::bench
