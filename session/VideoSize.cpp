#include "session/VideoSize.h"

#include "platform/threads/Log.h"
#include "support/QVDeviceLayout.h"

namespace qv {

using platform::Size;
namespace logs = platform::logs;

namespace {
constexpr double kMaximumSide = 1920.0;
constexpr double kSmallTabletMaximumSide = 1600.0;
constexpr int64_t kSmallTabletChip = 0x8960;
}  // namespace

int64_t chipId(platform::DeviceInfoQuery& device) { return device.integerProperty("ChipID"); }

Size _maximumSizeWithSize(Size size, platform::PreferenceStore& preferences, platform::DeviceInfoQuery& device) {
  if (preferences.valueForKey(kPreferenceDomain, "QVFullResCapture").asBool()) {
    QV_LOG(logs::kSession, "full res capture enabled");
    return size;
  }
  const bool isSmallTablet =
      device.userInterfaceIdiom() == platform::UserInterfaceIdiom::Tablet && chipId(device) == kSmallTabletChip;
  const double limit = isSmallTablet ? kSmallTabletMaximumSide : kMaximumSide;
  if (size.height > limit) {
    size.width *= limit / size.height;
    size.height = limit;
  }
  if (size.width > limit) {
    size.height *= limit / size.width;
    size.width = limit;
  }
  return size;
}

}  // namespace qv
