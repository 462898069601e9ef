#include <cmath>

#include "platform/threads/Log.h"
#include "support/QVDeviceLayout.h"
#include "writer/QVMovieWriter.h"

namespace qv {

using platform::Dictionary;
using platform::Value;
namespace logs = platform::logs;
namespace settings = platform::settings;

namespace {

constexpr double kLargeSide = 1920.0;
constexpr int64_t kTabletBitRate = 7'000'000;
constexpr int64_t kLargeBitRate = 5'000'000;
constexpr int64_t kDefaultBitRate = 3'000'000;
constexpr int32_t kDefaultFrameRate = 60;
constexpr int32_t kDefaultKeyFrameInterval = 60;

/// The compression properties that are numbers; each has 1 as its least.
struct NumberProperty {
  std::string_view key;
  int64_t maximum;
};
constexpr NumberProperty kNumberProperties[] = {
    {settings::kAverageBitRate, settings::kMaximumAverageBitRate},
    {settings::kExpectedSourceFrameRate, settings::kMaximumExpectedSourceFrameRate},
    {settings::kMaxKeyFrameInterval, settings::kMaximumKeyFrameInterval}};

/// Of 1 to `maximum`, also where it came as a double; nothing of a boolean, which is no quantity.
std::optional<int64_t> wholeNumber(const Value& value, int64_t maximum) {
  if (!value.isNumber() || value.getIf<bool>()) return std::nullopt;
  if (const double* number = value.getIf<double>(); number && *number != std::trunc(*number)) return std::nullopt;
  const int64_t whole = value.asInteger();
  return whole >= 1 && whole <= maximum ? std::optional(whole) : std::nullopt;
}

/// The value as the encoder takes it; a none value where it cannot. Keys that only the encoder knows stay as they are.
Value usableValue(const std::string& key, const Value& value) {
  for (const NumberProperty& property : kNumberProperties) {
    if (key != property.key) continue;
    const auto whole = wholeNumber(value, property.maximum);
    return whole ? Value(*whole) : Value();
  }
  return key == settings::kProfileLevel && !value.getIf<std::string>() ? Value() : value;
}

void merge(const Dictionary& custom, Dictionary& properties) {
  QV_LOG(logs::kWriter, "using custom video compression properties");
  for (const auto& [key, value] : custom) {
    Value usable = usableValue(key, value);
    if (usable.isNone()) {
      QV_LOG_ERROR(logs::kWriter, "compression property %s has no usable value, ignored", key.c_str());
    } else {
      properties.insert_or_assign(key, std::move(usable));
    }
  }
}

}  // namespace

int64_t QVMovieWriter::bitRate() const {
  const Value override = platform_.preferences->valueForKey(kPreferenceDomain, "QVBitRateOverride");
  if (const auto rate = wholeNumber(override, settings::kMaximumAverageBitRate)) return *rate;
  if (!override.isNone()) QV_LOG_ERROR(logs::kWriter, "QVBitRateOverride is no usable bit rate, ignored");
  if (platform_.deviceInfo->userInterfaceIdiom() == platform::UserInterfaceIdiom::Tablet) {
    return kTabletBitRate;
  }
  return windowSize_.width >= kLargeSide || windowSize_.height >= kLargeSide ? kLargeBitRate : kDefaultBitRate;
}

Dictionary QVMovieWriter::compressionProperties() const {
  const int64_t rate = bitRate();
  QV_LOG(logs::kWriter, "bit rate set to %ld", static_cast<long>(rate));
  Dictionary properties{{settings::kExpectedSourceFrameRate, Value(kDefaultFrameRate)},
                        {settings::kProfileLevel, Value(settings::kProfileHighAutoLevel)},
                        {settings::kAverageBitRate, Value(rate)},
                        {settings::kMaxKeyFrameInterval, Value(kDefaultKeyFrameInterval)}};
  if (broadcastConfig_ && !broadcastConfig_->videoCompressionProperties.empty()) {
    merge(broadcastConfig_->videoCompressionProperties, properties);
  }
  return properties;
}

}  // namespace qv
