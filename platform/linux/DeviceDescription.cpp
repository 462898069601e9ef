#include "platform/linux/DeviceDescription.h"

#include <cerrno>

#include "platform/linux/Json.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr const char kIdiom[] = "idiom";
constexpr const char kChipID[] = "chipID";
constexpr const char kAudioCaptureDevice[] = "audioCaptureDevice";
constexpr const char kInternalBuild[] = "internalBuild";
constexpr const char kShutterClick[] = "RegionalBehaviorShutterClick";

bool isBoolean(const Value& value) { return value.getIf<bool>() != nullptr; }
bool isInteger(const Value& value) { return value.getIf<int64_t>() != nullptr; }

bool isIdiom(const Value& value) {
  const std::string name = value.asString();
  return name == "television" || name == "tablet" || name == "phone";
}

bool isRightFor(const std::string& key, const Value& value) {
  if (key == kIdiom) return isIdiom(value);
  if (key == kChipID) return isInteger(value);
  if (key == kAudioCaptureDevice || key == kInternalBuild || key == kShutterClick) return isBoolean(value);
  return isBoolean(value) || isInteger(value);
}

}  // namespace

DeviceDescription::DeviceDescription(const std::string& deviceRoot) : path_(deviceRoot + "/etc/quorvel/device.json") {}

const Dictionary& DeviceDescription::description() {
  std::call_once(loaded_, [this] { load(); });
  return description_;
}

void DeviceDescription::load() {
  auto entries = readJSONDictionary(path_);
  if (!entries) {
    if (entries.error().code == ENOENT) return;
    QV_LOG_ERROR(logs::kPlatform, "device description %s: %s", path_.c_str(), entries.error().description().c_str());
    return;
  }
  for (const auto& [key, value] : entries.value()) {
    if (isRightFor(key, value)) {
      description_.emplace(key, value);
    } else {
      QV_LOG_ERROR(logs::kPlatform, "device description: entry \"%s\" is ignored", key.c_str());
    }
  }
}

UserInterfaceIdiom DeviceDescription::userInterfaceIdiom() {
  const std::string name = valueForKey(description(), kIdiom).asString();
  if (name == "tablet") return UserInterfaceIdiom::Tablet;
  if (name == "phone") return UserInterfaceIdiom::Phone;
  return UserInterfaceIdiom::Television;
}

int64_t DeviceDescription::integerProperty(std::string_view name) {
  const Value value = valueForKey(description(), name == "ChipID" ? kChipID : name);
  return isInteger(value) ? value.asInteger() : 0;
}

bool DeviceDescription::booleanProperty(std::string_view name) {
  const Value value = valueForKey(description(), name);
  return isBoolean(value) && value.asBool();
}

bool DeviceDescription::hasAudioCaptureDevice() { return booleanProperty(kAudioCaptureDevice); }
bool DeviceDescription::allowsInternalSecurityPolicies(std::string_view) { return booleanProperty(kInternalBuild); }

}  // namespace qv::platform
