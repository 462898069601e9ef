#include "extensions/QVBroadcastConfiguration.h"

#include "platform/KeyedArchive.h"

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

}  // namespace qv
