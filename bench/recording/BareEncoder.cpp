// The least that a recording of the example application can cost: its scene, drawn and converted by
// this program, goes into the encoder at the pace of the screen. Prints the processor seconds that the
// encoder takes for a second of movie; drawing and converting are not counted.

#include <time.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "examples/game/Scene.h"
#include "platform/AssetWriter.h"
#include "platform/ffmpeg/ColorConversion.h"
#include "platform/ffmpeg/VideoEncoder.h"
#include "platform/ffmpeg/WriterSettings.h"

using namespace qv::platform;

namespace {

int64_t nanoseconds(clockid_t clock) {
  timespec time{};
  ::clock_gettime(clock, &time);
  return int64_t{time.tv_sec} * 1'000'000'000 + time.tv_nsec;
}

void sleepUntil(int64_t instant) {
  const timespec time{instant / 1'000'000'000, instant % 1'000'000'000};
  ::clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &time, nullptr);
}

ffmpeg::VideoSettings videoSettings(uint32_t width, uint32_t height, int32_t bitRate) {
  return ffmpeg::parseVideoSettings(
      {{settings::kVideoWidth, Value(double(width))},
       {settings::kVideoHeight, Value(double(height))},
       {settings::kCompressionProperties, Value(Dictionary{{settings::kExpectedSourceFrameRate, Value(int32_t{60})},
                                                           {settings::kMaxKeyFrameInterval, Value(int32_t{60})},
                                                           {settings::kAverageBitRate, Value(bitRate)}})}});
}

ffmpeg::Frame makePicture(int width, int height) {
  ffmpeg::Frame picture(av_frame_alloc());
  picture->format = AV_PIX_FMT_YUV420P;
  picture->width = width;
  picture->height = height;
  return av_frame_get_buffer(picture.get(), 0) == 0 ? std::move(picture) : nullptr;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 6) {
    std::fprintf(stderr, "usage: bench_bare_encoder WIDTH HEIGHT FPS BITS_PER_SECOND SECONDS\n");
    return 2;
  }
  const auto width = static_cast<uint32_t>(std::atoi(argv[1])), height = static_cast<uint32_t>(std::atoi(argv[2]));
  const int fps = std::atoi(argv[3]);
  const double seconds = std::atof(argv[5]);
  auto encoder = ffmpeg::VideoEncoder::open(videoSettings(width, height, std::atoi(argv[4])));
  auto frame = SharedFrame::create({width, height, width * 4});
  auto picture = makePicture(static_cast<int>(width), static_cast<int>(height));
  if (!encoder || !frame || !picture || fps <= 0) return 1;
  const PixelBuffer image(frame.value());
  const std::span pixels(reinterpret_cast<uint32_t*>(frame.value()->mutableBytes().data()), size_t{width} * height);
  ffmpeg::ColorConverter converter;
  std::vector<qv::platform::mp4::EncodedSample> samples;

  const int count = static_cast<int>(seconds * fps);
  const int64_t began = nanoseconds(CLOCK_MONOTONIC);
  const int64_t usedBefore = nanoseconds(CLOCK_PROCESS_CPUTIME_ID);
  int64_t notCounted = 0;
  for (int i = 0; i < count; ++i) {
    const int64_t instant = began + int64_t{i} * 1'000'000'000 / fps;
    sleepUntil(instant);
    const int64_t drawing = nanoseconds(CLOCK_THREAD_CPUTIME_ID);
    // The encoder may still read the last picture: then this one goes into other memory.
    if (av_frame_make_writable(picture.get()) < 0) return 1;
    const auto shown = std::chrono::nanoseconds(instant);
    comet::drawScene(pixels, width, height, shown, comet::isFlash(shown));
    converter.convert(image, {picture->width,
                              picture->height,
                              {picture->data[0], picture->data[1], picture->data[2]},
                              {picture->linesize[0], picture->linesize[1], picture->linesize[2]}});
    notCounted += nanoseconds(CLOCK_THREAD_CPUTIME_ID) - drawing;
    if (encoder.value()->encode(*picture, int64_t{i} * 90'000 / fps, samples)) return 1;
    samples.clear();
  }
  if (encoder.value()->flush(samples)) return 1;
  const int64_t used = nanoseconds(CLOCK_PROCESS_CPUTIME_ID) - usedBefore - notCounted;
  std::printf("%.4f\n", static_cast<double>(used) / 1e9 / seconds);
}
