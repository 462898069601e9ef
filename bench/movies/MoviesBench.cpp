// What the movie writer costs beside the encoder that it drives: processor time of the same pictures
// encoded bare, and written with two tracks of sound; and how long a finish takes.

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <string>
#include <thread>
#include <vector>

#include "platform/ffmpeg/ColorConversion.h"
#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/VideoEncoder.h"

using namespace qv::platform;

namespace {

constexpr int kPictures = 180;
constexpr int kRounds = 3;

double processorSeconds() {
  rusage usage{};
  ::getrusage(RUSAGE_SELF, &usage);
  const auto seconds = [](const timeval& t) {
    return static_cast<double>(t.tv_sec) + static_cast<double>(t.tv_usec) / 1e6;
  };
  return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

/// A textured scene that moves and turns, so that the encoder has something to do.
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

Dictionary videoSettings(uint32_t width, uint32_t height) {
  return {{settings::kVideoWidth, Value(double(width))},
          {settings::kVideoHeight, Value(double(height))},
          {settings::kCompressionProperties,
           Value(Dictionary{{settings::kAverageBitRate, Value(int32_t{width >= 1920 ? 5'000'000 : 3'000'000})}})}};
}

double encodeBare(const std::vector<PixelBufferRef>& scene, uint32_t width, uint32_t height) {
  std::vector<ffmpeg::Frame> frames;
  for (const auto& image : scene) {
    ffmpeg::Frame frame(av_frame_alloc());
    frame->format = AV_PIX_FMT_YUV420P;
    frame->width = static_cast<int>(width);
    frame->height = static_cast<int>(height);
    if (av_frame_get_buffer(frame.get(), 0) != 0) std::abort();
    ffmpeg::ColorConverter converter;
    converter.convert(*image, {frame->width,
                               frame->height,
                               {frame->data[0], frame->data[1], frame->data[2]},
                               {frame->linesize[0], frame->linesize[1], frame->linesize[2]}});
    frames.push_back(std::move(frame));
  }
  auto encoder = ffmpeg::VideoEncoder::open(ffmpeg::parseVideoSettings(videoSettings(width, height)));
  const double before = processorSeconds();
  std::vector<mp4::EncodedSample> out;
  for (int i = 0; i < kPictures; ++i) {
    (void)encoder.value()->encode(*frames[static_cast<size_t>(i) % frames.size()], i * 1500, out);
    out.clear();
  }
  (void)encoder.value()->flush(out);
  return processorSeconds() - before;
}

SampleBufferRef tone(double time) {
  std::vector<uint8_t> bytes(735 * 2);
  for (size_t i = 0; i < 735; ++i) {
    const auto v = static_cast<int16_t>(8000 * std::sin((time * 44100 + static_cast<double>(i)) * 0.05));
    bytes[2 * i] = static_cast<uint8_t>(v >> 8);
    bytes[2 * i + 1] = static_cast<uint8_t>(v);
  }
  AudioStreamDescription format{
      44100, kAudioFormatLinearPCM, kAudioFormatFlagIsSignedInteger | kAudioFormatFlagIsBigEndian, 2, 1, 2, 1, 16, 0};
  return SampleBuffer::makeAudio(std::make_shared<DataBlock>(std::move(bytes)),
                                 std::make_shared<AudioFormatDescription>(AudioFormatDescription{format}), 735,
                                 MediaTime::fromSeconds(time, kHostTimescale));
}

void append(WriterInput& input, const SampleBufferRef& sample) {
  while (!input.append(sample)) std::this_thread::sleep_for(std::chrono::milliseconds(2));
}

double writeMovie(const std::vector<PixelBufferRef>& scene, uint32_t width, uint32_t height, double& finishSeconds) {
  char name[] = "/tmp/quorveld-bench-XXXXXX";
  const std::string directory = ::mkdtemp(name);
  const std::string path = directory + "/movie.mp4";
  ffmpeg::FFmpegAssetWriterService service;
  const double before = processorSeconds();
  auto writer = std::move(service.createAssetWriter(URL::fileURL(path), kFileTypeMPEG4).value());
  auto video = service.createWriterInput(MediaType::Video, videoSettings(width, height));
  auto sound1 = service.createWriterInput(MediaType::Audio, {});
  auto sound2 = service.createWriterInput(MediaType::Audio, {});
  for (const auto& input : {video, sound1, sound2}) writer->addInput(input);
  if (!writer->startWriting()) std::abort();
  writer->startSessionAtSourceTime(MediaTime::zero());
  for (int i = 0; i < kPictures; ++i) {
    const double time = i / 60.0;
    append(*video, SampleBuffer::makeVideo(scene[static_cast<size_t>(i) % scene.size()],
                                           MediaTime::fromSeconds(time, kHostTimescale), MediaTime::invalid()));
    append(*sound1, tone(time));
    append(*sound2, tone(time));
  }
  const auto began = std::chrono::steady_clock::now();
  std::promise<void> done;
  writer->finishWriting([&] { done.set_value(); });
  done.get_future().wait();
  finishSeconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count();
  const double used = processorSeconds() - before;
  (void)::unlink(path.c_str());
  (void)::rmdir(directory.c_str());
  return used;
}

}  // namespace

int main() {
  for (const auto& [width, height] : {std::pair{1280u, 720u}, std::pair{1920u, 1080u}}) {
    const auto scene = makeScene(width, height);
    std::vector<double> ratios;
    double finish = 0;
    for (int round = 0; round < kRounds; ++round) {
      const double bare = encodeBare(scene, width, height);
      const double written = writeMovie(scene, width, height, finish);
      ratios.push_back(written / bare);
      std::printf("%ux%u: bare %.2f ms/picture, writer %.2f ms/picture, ratio %.3f, finish %.1f ms\n", width, height,
                  bare / kPictures * 1e3, written / kPictures * 1e3, written / bare, finish * 1e3);
    }
    std::sort(ratios.begin(), ratios.end());
    std::printf("%ux%u: median ratio %.3f\n", width, height, ratios[kRounds / 2]);
  }
}
