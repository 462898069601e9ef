#include "platform/ffmpeg/WriterSettings.h"

#include <algorithm>
#include <string>

#include "platform/AssetWriter.h"
#include "platform/Log.h"

namespace qv::platform::ffmpeg {
namespace {

constexpr int kMinimumSide = 16;
constexpr int kMaximumSide = 8192;
constexpr int64_t kMinimumBitRate = 50'000;
constexpr int64_t kMaximumBitRate = 200'000'000;
constexpr int64_t kDefaultBitRate = 3'000'000;

int64_t integer(const Dictionary& settings, const char* key, int64_t fallback, int64_t low, int64_t high) {
  const Value* value = find(settings, key);
  return std::clamp(value ? value->asInteger(fallback) : fallback, low, high);
}

int evenSide(const Dictionary& settings, const char* key) {
  const int64_t side = integer(settings, key, 0, kMinimumSide, kMaximumSide);
  return static_cast<int>(side + side % 2);
}

void logUnknownProperties(const Dictionary& properties) {
  static constexpr std::string_view kKnown[] = {settings::kAverageBitRate, settings::kExpectedSourceFrameRate,
                                                settings::kMaxKeyFrameInterval, settings::kProfileLevel};
  for (const auto& [key, value] : properties) {
    if (std::find(std::begin(kKnown), std::end(kKnown), key) == std::end(kKnown)) {
      QV_LOG(logs::kMovie, "compression property %s is unknown and ignored", key.c_str());
    }
  }
}

}  // namespace

VideoSettings parseVideoSettings(const Dictionary& outputSettings) {
  const Dictionary properties = valueForKey(outputSettings, settings::kCompressionProperties).asDictionary();
  logUnknownProperties(properties);
  VideoSettings result;
  result.width = evenSide(outputSettings, settings::kVideoWidth);
  result.height = evenSide(outputSettings, settings::kVideoHeight);
  result.bitRate = integer(properties, settings::kAverageBitRate, kDefaultBitRate, kMinimumBitRate, kMaximumBitRate);
  result.frameRate = static_cast<int>(integer(properties, settings::kExpectedSourceFrameRate, 60, 1, 240));
  result.keyFrameInterval = static_cast<int>(integer(properties, settings::kMaxKeyFrameInterval, 60, 1, 600));
  return result;
}

AudioSettings parseAudioSettings(const Dictionary& outputSettings) {
  AudioSettings result;
  // The two rates at which every player plays AAC.
  if (integer(outputSettings, settings::kSampleRate, 44100, 0, 192000) == 48000) result.sampleRate = 48000;
  result.bitRate = integer(outputSettings, settings::kEncoderBitRate, 128000, 32000, 320000);
  return result;
}

}  // namespace qv::platform::ffmpeg
