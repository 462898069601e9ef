#include "protocol/QVBroadcastConfiguration.h"

#include <algorithm>
#include <cmath>

#include "platform/base/KeyedArchive.h"

namespace qv {
namespace {
constexpr const char kClassName[] = "QVBroadcastConfiguration";
constexpr const char kClipDuration[] = "clipDuration";
constexpr const char kVideoCompressionProperties[] = "videoCompressionProperties";
}  // namespace

platform::Data QVBroadcastConfiguration::encode() const {
  platform::Dictionary fields{{kClipDuration, platform::Value(clipDuration)}};
  if (!videoCompressionProperties.empty()) {
    fields.emplace(kVideoCompressionProperties, platform::Value(videoCompressionProperties));
  }
  return platform::encodeKeyedArchive(kClassName, fields);
}

platform::Result<QVBroadcastConfiguration> QVBroadcastConfiguration::decode(std::span<const uint8_t> archive) {
  auto fields = platform::decodeKeyedArchive(archive, kClassName);
  if (!fields) return fields.error();
  return QVBroadcastConfiguration{
      platform::valueForKey(*fields, kClipDuration).asDouble(),
      platform::valueForKey(*fields, kVideoCompressionProperties).asDictionary(),
  };
}

platform::Result<QVBroadcastConfiguration> QVBroadcastConfiguration::decodeReceived(std::span<const uint8_t> archive) {
  if (archive.size() > kMaximumArchiveSize) return platform::Error::posix(EFBIG, "broadcast configuration");
  auto configuration = decode(archive);
  if (!configuration) return configuration.error();
  const double duration = configuration->clipDuration;
  if (!std::isfinite(duration) || duration < 0) return platform::Error::posix(EDOM, "clip duration");
  return configuration;
}

double QVBroadcastConfiguration::effectiveClipDuration() const {
  if (!(clipDuration > 0)) return kDefaultClipDuration;
  return std::clamp(clipDuration, kShortestClipDuration, kLongestClipDuration);
}

}  // namespace qv
