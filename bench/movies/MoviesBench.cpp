// What the movie layer costs: a table of target, measurement and verdict. Exits 1 where a target is missed.

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <future>

#include "bench/movies/MadeUpMovie.h"
#include "bench/movies/Recording.h"
#include "platform/ExportSession.h"
#include "platform/ffmpeg/ColorConversion.h"
#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/MovieReader.h"
#include "platform/ffmpeg/VideoEncoderChoice.h"
#include "platform/threads/Log.h"

using namespace qv::platform;
using namespace qv::bench;

namespace {

constexpr int kRounds = 3;
using Clock = std::chrono::steady_clock;

double millisecondsSince(Clock::time_point began) {
  return std::chrono::duration<double, std::milli>(Clock::now() - began).count();
}

template <typename Measure>
double median(Measure measure) {
  std::vector<double> values;
  for (int round = 0; round < kRounds; ++round) values.push_back(measure());
  std::sort(values.begin(), values.end());
  return values[kRounds / 2];
}

/// One line of the table.
class Table {
 public:
  Table() { std::printf("%-44s %12s %12s  %-7s %s\n", "", "target", "measured", "", "compared"); }
  void row(const char* what, double target, double measured, const char* unit, const std::string& compared) {
    const bool isMet = measured <= target;
    allMet_ = allMet_ && isMet;
    std::printf("%-44s %5.4g %-6s %5.4g %-6s  %-7s %s\n", what, target, unit, measured, unit, isMet ? "met" : "MISSED",
                compared.c_str());
    std::fflush(stdout);
  }
  /// Something that has no target.
  static void note(const char* what, double measured, const char* unit, const std::string& compared) {
    std::printf("%-44s %12s %5.4g %-6s  %-7s %s\n", what, "", measured, unit, "", compared.c_str());
  }
  [[nodiscard]] bool allMet() const { return allMet_; }

 private:
  bool allMet_ = true;
};

class Scratch {
 public:
  Scratch() {
    char name[] = "/tmp/quorveld-bench-XXXXXX";
    path_ = ::mkdtemp(name);
  }
  ~Scratch() { std::filesystem::remove_all(path_); }
  /// A name for a file that is not there yet.
  std::string fresh() { return path_ + "/" + std::to_string(++count_) + ".mp4"; }

 private:
  std::string path_;
  int count_ = 0;
};

/// Of the pictures of `plan`, converted beforehand, by the encoder alone.
double encodeBare(const RecordingPlan& plan, const std::vector<PixelBufferRef>& scene) {
  std::vector<ffmpeg::Frame> frames;
  for (const auto& image : scene) {
    ffmpeg::Frame frame(av_frame_alloc());
    frame->format = AV_PIX_FMT_YUV420P;
    frame->width = static_cast<int>(plan.width);
    frame->height = static_cast<int>(plan.height);
    if (av_frame_get_buffer(frame.get(), 0) != 0) std::abort();
    ffmpeg::ColorConverter converter;
    converter.convert(*image, {frame->width,
                               frame->height,
                               {frame->data[0], frame->data[1], frame->data[2]},
                               {frame->linesize[0], frame->linesize[1], frame->linesize[2]}});
    frames.push_back(std::move(frame));
  }
  auto encoder = ffmpeg::VideoEncoder::open(ffmpeg::parseVideoSettings(videoSettings(plan)));
  const double before = processorSeconds();
  std::vector<mp4::EncodedSample> out;
  const int pictures = static_cast<int>(plan.seconds * plan.picturesPerSecond);
  for (int i = 0; i < pictures; ++i) {
    const int64_t tick = int64_t{i} * mp4::kMovieTimescale / plan.picturesPerSecond;
    (void)encoder.value()->encode(*frames[static_cast<size_t>(i) % frames.size()], tick, out);
    out.clear();
  }
  (void)encoder.value()->flush(out);
  return processorSeconds() - before;
}

/// Milliseconds of a whole export, from opening the source on.
double runExport(const std::string& source, const std::string& output, ExportPreset preset, MediaTimeRange range = {}) {
  ffmpeg::FFmpegExportService service;
  const auto began = Clock::now();
  const auto asset = service.openMovie(URL::fileURL(source));
  auto session = service.createExportSession(asset, preset);
  session->setOutputURL(URL::fileURL(output));
  session->setOutputFileType(kFileTypeMPEG4);
  if (range.duration.isNumeric()) session->setTimeRange(range);
  std::vector<AudioMixInputParameters> mix;
  for (const int32_t trackID : asset->audioTrackIDs()) mix.push_back({trackID});
  session->setAudioMix(std::move(mix));
  std::promise<void> done;
  session->exportAsynchronously([&] { done.set_value(); });
  done.get_future().wait();
  if (session->status() == ExportStatus::Completed) return millisecondsSince(began);
  std::fprintf(stderr, "export: %s\n", session->error()->description().c_str());
  std::exit(1);
}

/// Megabytes that a process of its own comes to, which does nothing but mix `source`.
double mixMemory(const char* program, const std::string& source, const std::string& output) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::execl(program, program, "--mix", source.c_str(), output.c_str(), nullptr);
    ::_exit(127);
  }
  int status = 0;
  rusage usage{};
  if (::wait4(child, &status, 0, &usage) != child || status != 0) std::exit(1);
  return static_cast<double>(usage.ru_maxrss) / 1024;
}

/// Of the video track alone, from `from` to the end, bits per second.
double pictureRate(const std::string& path, double from, double seconds) {
  auto reader = ffmpeg::MovieReader::open(path, nullptr);
  if (!reader) std::exit(1);
  const AVStream* video = (*reader)->streams(AVMEDIA_TYPE_VIDEO).front();
  const ffmpeg::Packet packet(av_packet_alloc());
  double bits = 0;
  for (auto more = (*reader)->read(*packet); more && more.value(); more = (*reader)->read(*packet)) {
    const double time = static_cast<double>(packet->pts) * av_q2d(video->time_base);
    if (packet->stream_index == video->index && time >= from) bits += 8.0 * packet->size;
    av_packet_unref(packet.get());
  }
  return bits / seconds;
}

void measureWriter(Table& table, Scratch& scratch) {
  for (const RecordingPlan& plan : {RecordingPlan{}, RecordingPlan{1920, 1080, 60, 5'000'000}}) {
    const auto scene = makeScene(plan.width, plan.height);
    const double ratio = median([&] {
      const double bare = encodeBare(plan, scene);
      return recordMovie(scratch.fresh(), plan, scene).processorSeconds / bare;
    });
    const std::string what = "processor: writer / encoder, " + std::to_string(plan.height) + "p60";
    table.note(what.c_str(), ratio, "x",
               "three tracks written, against the same pictures through the bare encoder; median of 3");
  }
}

void measureExports(Table& table, Scratch& scratch, const char* program) {
  const RecordingPlan plan{640, 360, 30, 3'000'000, 95};
  const auto scene = makeScene(plan.width, plan.height);
  const std::string source = scratch.fresh();
  (void)recordMovie(source, plan, scene);
  const auto megabytes = std::to_string(std::filesystem::file_size(source) / 1'000'000) + " MB";
  const MediaTimeRange range{MediaTime::make(2, 1), MediaTime::make(90, 1)};
  const double trim = median([&] { return runExport(source, scratch.fresh(), ExportPreset::PassThrough, range); });
  table.row("trim of a movie of 95 s", 100, trim, "ms", "[2 s, 92 s) of " + megabytes + ", three tracks; median of 3");
  const std::string minute = scratch.fresh();
  (void)runExport(source, minute, ExportPreset::PassThrough, {MediaTime::zero(), MediaTime::make(60, 1)});
  const double mix = median([&] { return runExport(minute, scratch.fresh(), ExportPreset::HighestQuality); });
  table.row("mix of a minute", 3000, mix, "ms", "two tracks of sound into one, the picture copied; median of 3");
  table.row("mix of a minute: most memory", 60, mixMemory(program, minute, scratch.fresh()), "MB",
            "all that a process of its own has resident, its libraries included");
}

void measureMadeUp(Table& table, Scratch& scratch) {
  const auto finish = [&](int seconds) {
    const std::string path = scratch.fresh();
    const double took = makeUpMovie(path, seconds, 2, true).finishMilliseconds;
    ::unlink(path.c_str());
    return took;
  };
  table.row("finish of 10 s", 20, median([&] { return finish(10); }), "ms",
            "index and two syncs, made-up samples, all else synced before; median of 3");
  table.row("finish of an hour", 100, finish(3600), "ms", "the same, of 1.5 GB");
  const auto overhead = [](const MadeUpMovie& movie) {
    return 100 * static_cast<double>(movie.fileBytes - movie.mediaBytes) / static_cast<double>(movie.fileBytes);
  };
  table.row("index and fragments", 0.5, overhead(makeUpMovie({}, 3600, 1, false)), "%",
            "of an hour at 3 Mbit/s, 60 pictures a second at irregular times, the application's sound");
  const MadeUpMovie hour = makeUpMovie({}, 3600, 2, false);
  table.note("the same with a microphone", overhead(hour), "%", "");
  table.row("memory: the hour's end - its first minute", 8, static_cast<double>(hour.memoryGrowth) / 1e6, "MB",
            "the index of its 530,000 samples is all that may grow");
}

void measureStillScreen(Table& table, Scratch& scratch) {
  RecordingPlan plan;
  plan.seconds = 71;
  plan.stillFrom = 1;
  const std::string path = scratch.fresh();
  (void)recordMovie(path, plan, makeScene(plan.width, plan.height));
  table.row("still screen", 200, pictureRate(path, 1, 70) / 1000, "kbit/s",
            "70 s of heartbeats after a lively second, 720p at 3 Mbit/s, pictures alone");
}

void measureOpening(Table& table) {
  const ffmpeg::FFmpegAssetWriterService service;  // the libraries' log goes where ours does
  ffmpeg::VideoEncoderChoice encoders(ffmpeg::h264Codecs(), ffmpeg::FFmpegAssetWriterService::kTrialPatience);
  const auto began = Clock::now();
  if (!encoders.open(ffmpeg::parseVideoSettings(videoSettings({})))) std::exit(1);
  table.row("choice and opening of an encoder", 150, millisecondsSince(began), "ms",
            "the first of the process, with the devices of this machine");
}

}  // namespace

int main(int argc, char** argv) {
  if (argc == 4 && std::strcmp(argv[1], "--mix") == 0) {
    (void)runExport(argv[2], argv[3], ExportPreset::HighestQuality);
    return 0;
  }
  setLogLevel(LogLevel::Error);
  Scratch scratch;
  Table table;
  measureOpening(table);
  measureMadeUp(table, scratch);
  measureExports(table, scratch, "/proc/self/exe");
  measureStillScreen(table, scratch);
  measureWriter(table, scratch);
  return table.allMet() ? 0 : 1;
}
