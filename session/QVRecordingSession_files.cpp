#include <algorithm>

#include "platform/Log.h"
#include "session/QVRecordingSession.h"
#include "support/QVExtensions.h"
#include "support/QVTemporaryFiles.h"

namespace qv {

using platform::Platform;
using platform::Size;
namespace logs = platform::logs;

namespace {

constexpr const char kPreferenceDomain[] = "com.tarnwick.quorveld";
constexpr double kMaximumSide = 1920.0;
constexpr double kSmallTabletMaximumSide = 1600.0;
constexpr int64_t kSmallTabletChip = 0x8960;
constexpr size_t kMaximumNameBytes = 200;  // leaves room for suffixes within a name of 255 bytes

/// A display name as one path component: it may hold anything that a person would call an app.
std::string fileNameFromDisplayName(std::string name) {
  std::replace(name.begin(), name.end(), '/', ':');
  std::erase_if(name, [](unsigned char c) { return c < 0x20 || c == 0x7f; });
  if (name.size() > kMaximumNameBytes) {
    size_t end = kMaximumNameBytes;
    while (end > 0 && (static_cast<unsigned char>(name[end]) & 0xC0) == 0x80) --end;
    name.resize(end);
  }
  if (!name.empty() && name.front() == '.') name.front() = '_';
  return name;
}

std::string movieName(const std::string& bundleID) {
  const auto displayName = _qvLocalizedAppNameFromBundleID(bundleID);
  const std::string name = fileNameFromDisplayName(displayName.value_or(std::string()));
  return name.empty() ? fileNameFromDisplayName(bundleID) : name;
}

}  // namespace

std::string QVRecordingSession::outputPath() const {
  if (hasBroadcastExtension()) {
    return _srTempPath() + "/QVMovie_" + fileNameFromDisplayName(bundleID_) + "_" +
           std::to_string(Platform::current().clock->now().secondsSince1970) + "_" +
           std::to_string(broadcastFragmentIndex_) + ".mp4";
  }
  if (systemRecording_) {
    Platform& platform = Platform::current();
    std::string date = platform.localization->formatDate(platform.clock->now(), "MM-dd-yyyy HH:mm:ss");
    std::replace(date.begin(), date.end(), ':', '-');
    return _srTempPath() + "/ScreenRecording_" + date + ".mp4";
  }
  return _srTempPath() + "/" + movieName(bundleID_) + ".mp4";
}

std::string QVRecordingSession::trimmedOutputPath() const {
  return _srTempPath() + "/" + movieName(bundleID_) + "_trimmed.mp4";
}

void QVRecordingSession::setWindowSize(Size size) {
  originalWindowSize_ = size;
  windowSize_ = _maximumSizeWithSize(size);
}

Size QVRecordingSession::_maximumSizeWithSize(Size size) {
  Platform& platform = Platform::current();
  if (platform.preferences->valueForKey(kPreferenceDomain, "QVFullResCapture").asBool()) {
    QV_LOG(logs::kSession, "full res capture enabled");
    return size;
  }
  double limit = kMaximumSide;
  if (platform.deviceInfo->userInterfaceIdiom() == platform::UserInterfaceIdiom::Tablet &&
      chipId() == kSmallTabletChip) {
    limit = kSmallTabletMaximumSide;
  }
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

int64_t QVRecordingSession::chipId() {
  if (chipId_ == 0) chipId_ = Platform::current().deviceInfo->integerProperty("ChipID");
  return chipId_;
}

}  // namespace qv
