#include "platform/ffmpeg/WriterSettings.h"

#include <algorithm>
#include <string>

#include "platform/AssetWriter.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {
namespace {

constexpr int kMinimumSide = 2;
constexpr int kMaximumSide = 8192;
constexpr int64_t kMinimumBitRate = 50'000;
constexpr int64_t kDefaultBitRate = 3'000'000;
constexpr size_t kMaximumNamesInLog = 8;

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
  std::string names;
  size_t count = 0;
  for (const auto& [key, value] : properties) {
    if (std::find(std::begin(kKnown), std::end(kKnown), key) != std::end(kKnown)) continue;
    if (++count <= kMaximumNamesInLog) names += (count > 1 ? ", " : "") + key;
  }
  if (count > 0) {
    QV_LOG(logs::kMovie, "%zu compression properties are unknown and ignored: %s", count, names.c_str());
  }
}

int64_t bitRate(const Dictionary& properties) {
  const int64_t asked =
      integer(properties, settings::kAverageBitRate, kDefaultBitRate, 1, settings::kMaximumAverageBitRate);
  if (asked >= kMinimumBitRate) return asked;
  QV_LOG(logs::kMovie, "a bit rate of %lld is too small, %lld is taken", static_cast<long long>(asked),
         static_cast<long long>(kMinimumBitRate));
  return kMinimumBitRate;
}

/// Names read H264_<profile>_<level>.
H264Profile profile(const Dictionary& properties) {
  static constexpr std::pair<std::string_view, H264Profile> kProfiles[] = {
      {"H264_Baseline_", H264Profile::Baseline}, {"H264_Main_", H264Profile::Main}, {"H264_High_", H264Profile::High}};
  const std::string name = valueForKey(properties, settings::kProfileLevel).asString(settings::kProfileHighAutoLevel);
  for (const auto& [prefix, profile] : kProfiles) {
    if (!name.starts_with(prefix)) continue;
    if (name.substr(prefix.size()) != "AutoLevel") {
      QV_LOG(logs::kMovie, "the level of %s is not followed, it follows from size and rate", name.c_str());
    }
    return profile;
  }
  QV_LOG(logs::kMovie, "profile %s is unknown, High is taken", name.c_str());
  return H264Profile::High;
}

}  // namespace

VideoSettings parseVideoSettings(const Dictionary& outputSettings) {
  const Dictionary properties = valueForKey(outputSettings, settings::kCompressionProperties).asDictionary();
  logUnknownProperties(properties);
  VideoSettings result;
  result.width = evenSide(outputSettings, settings::kVideoWidth);
  result.height = evenSide(outputSettings, settings::kVideoHeight);
  result.bitRate = bitRate(properties);
  result.frameRate = static_cast<int>(
      integer(properties, settings::kExpectedSourceFrameRate, 60, 1, settings::kMaximumExpectedSourceFrameRate));
  result.keyFrameInterval =
      static_cast<int>(integer(properties, settings::kMaxKeyFrameInterval, 60, 1, settings::kMaximumKeyFrameInterval));
  result.profile = profile(properties);
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
