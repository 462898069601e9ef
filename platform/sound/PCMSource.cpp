#include "platform/sound/PCMSource.h"

#include <algorithm>
#include <atomic>
#include <bit>

namespace qv::platform {
namespace {

using std::chrono::nanoseconds;

constexpr nanoseconds kTick = std::chrono::milliseconds(10);
constexpr int64_t kNanosecondsPerSecond = 1'000'000'000;
/// Ends of a run that are none in time.
constexpr int64_t kOpenEnd = INT64_MAX;
constexpr int64_t kNoRest = INT64_MIN;

/// Both without overflow for centuries.
int64_t framesIn(nanoseconds time, uint32_t rate) {
  const int64_t seconds = time.count() / kNanosecondsPerSecond;
  return seconds * rate + time.count() % kNanosecondsPerSecond * rate / kNanosecondsPerSecond;
}

nanoseconds timeOf(int64_t frames, uint32_t rate) {
  return nanoseconds(frames / rate * kNanosecondsPerSecond + frames % rate * kNanosecondsPerSecond / rate);
}

constexpr uint32_t kIntegerFlags = kAudioFormatFlagIsSignedInteger | kAudioFormatFlagIsPacked;

}  // namespace

std::optional<PCMFormat> PCMFormat::fromDescription(const AudioStreamDescription& description) {
  if (description.sampleRate != 44100 && description.sampleRate != 48000) return std::nullopt;
  if (description.channelsPerFrame != 1 && description.channelsPerFrame != 2) return std::nullopt;
  const PCMFormat format{static_cast<uint32_t>(description.sampleRate), description.channelsPerFrame,
                         (description.formatFlags & kAudioFormatFlagIsBigEndian) != 0};
  if (format.description() != description) return std::nullopt;
  return format;
}

AudioStreamDescription PCMFormat::description() const {
  return {.sampleRate = static_cast<double>(sampleRate),
          .formatID = kAudioFormatLinearPCM,
          .formatFlags = kIntegerFlags | (isBigEndian ? uint32_t{kAudioFormatFlagIsBigEndian} : 0),
          .bytesPerPacket = bytesPerFrame(),
          .framesPerPacket = 1,
          .bytesPerFrame = bytesPerFrame(),
          .channelsPerFrame = channels,
          .bitsPerChannel = 16,
          .reserved = 0};
}

struct PCMPacer::Run {
  Run(PCMFormat f, std::unique_ptr<PCMSource> s, Callbacks c, PacedClock& time)
      : format(f),
        source(std::move(s)),
        callbacks(std::move(c)),
        clock(time),
        samples(size_t{f.sampleRate} / 100 * f.channels) {}

  PacedThread::TimePoint step();
  void finish();
  [[nodiscard]] bool isEnding() const { return end.load() != kOpenEnd; }
  void skipHoldUp(int64_t due);
  void renderBlock(int64_t frames);

  const PCMFormat format;
  const std::unique_ptr<PCMSource> source;
  const Callbacks callbacks;
  PacedClock& clock;
  const nanoseconds origin = clock.now().time_since_epoch();
  int64_t position = 0;
  int64_t ticks = 0;
  bool hasOpened = false;
  std::vector<int16_t> samples;  // one tick
  /// Host time up to which a stop wants the sound, in nanoseconds.
  std::atomic<int64_t> end = kOpenEnd;
};

PacedThread::TimePoint PCMPacer::Run::step() {
  if (!hasOpened) {
    hasOpened = true;
    callbacks.opened();
  }
  const nanoseconds elapsed = clock.now().time_since_epoch() - origin;
  const int64_t due = framesIn(elapsed - source->latency(), format.sampleRate);
  skipHoldUp(due);
  while (position < due && !isEnding()) renderBlock(std::min<int64_t>(due - position, format.sampleRate / 100));
  ticks = elapsed / kTick + 1;
  return PacedThread::TimePoint(origin + ticks * kTick);
}

void PCMPacer::Run::finish() {
  if (const int64_t time = end; hasOpened && time != kNoRest) {
    source->awaitSound(static_cast<uint64_t>(time));
    const int64_t due = framesIn(nanoseconds(time) - origin, format.sampleRate);
    skipHoldUp(due);
    while (position < due && end != kNoRest) renderBlock(std::min<int64_t>(due - position, format.sampleRate / 100));
    if (end != kNoRest) callbacks.completed();
  }
  callbacks.closed();
}

void PCMPacer::Run::skipHoldUp(int64_t due) {
  if (due - position > format.sampleRate) position = due - format.sampleRate / 10;
}

void PCMPacer::Run::renderBlock(int64_t frames) {
  const std::span<int16_t> block(samples.data(), static_cast<size_t>(frames) * format.channels);
  const auto hostTime = static_cast<uint64_t>((origin + timeOf(position, format.sampleRate)).count());
  source->render(hostTime, block);
  if (format.isBigEndian == (std::endian::native == std::endian::little)) {
    for (int16_t& sample : block) sample = static_cast<int16_t>(__builtin_bswap16(static_cast<uint16_t>(sample)));
  }
  callbacks.sink({hostTime,
                  position,
                  static_cast<uint32_t>(frames),
                  {reinterpret_cast<const uint8_t*>(block.data()), block.size_bytes()}});
  position += frames;
}

PCMPacer::PCMPacer(PCMFormat format, std::unique_ptr<PCMSource> source, Callbacks callbacks, PacedClock& clock)
    : run_(std::make_shared<Run>(format, std::move(source), std::move(callbacks), clock)),
      thread_([run = run_] { return run->step(); }, [run = run_] { run->finish(); }, clock) {}

PCMPacer::~PCMPacer() { run_->end = kNoRest; }

void PCMPacer::stop() {
  if (thread_.isCurrent()) {
    abandon();
    return;
  }
  int64_t open = kOpenEnd;
  run_->end.compare_exchange_strong(open, nanoseconds(run_->clock.now().time_since_epoch()).count());
  thread_.stop();
}

void PCMPacer::abandon() {
  run_->end = kNoRest;
  thread_.stop();
}

bool PCMPacer::isStopped() const { return run_->isEnding(); }

}  // namespace qv::platform
