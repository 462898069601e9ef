#pragma once

#include "platform/Sounds.h"
#include "platform/headless/HeadlessAlerts.h"
#include "platform/headless/HeadlessApplications.h"
#include "platform/headless/HeadlessScreen.h"
#include "platform/headless/HeadlessStatusBar.h"
#include "platform/sound/PacedDeviceCapture.h"
#include "platform/sound/PacedTapQueue.h"

namespace qv::platform {

struct HeadlessOptions {
  /// Answers alerts.
  AlertPolicy alertPolicy = alertAnswerFromEnvironment;
  /// The process id of a bundle identifier, for reports about applications; may be empty.
  HeadlessApplications::ProcessLookup processOfBundleIdentifier = nullptr;
  std::optional<std::string> frontmostApplication = std::nullopt;
  bool hasMicrophone = true;
  PacedClock* clock = &monotonicClock();  ///< the host clock
};

/// A device without hardware: a screen with a picture that can be read back, applications and a
/// microphone that beep in time with it (see TestSignal.h), alerts that answer themselves.
///
/// Each service stands by itself, so that a device may have some real ones beside these. Nothing
/// runs, and no memory of note is held, while nothing is captured.
///
/// Threading: thread-safe.
class HeadlessPlatform {
 public:
  explicit HeadlessPlatform(HeadlessOptions options);
  ~HeadlessPlatform();

  ScreenCaptureService& screenCapture() { return screen_; }
  PacedDeviceCapture& deviceCapture() { return deviceCapture_; }
  AppAudioTapService& appAudioTap() { return appAudioTap_; }
  HeadlessApplications& applications() { return applications_; }
  RenderServer& renderServer() { return renderServer_; }
  UserAlertService& userAlerts() { return alerts_; }
  StatusBarOverrideCoordinator& statusBar() { return statusBar_; }
  SystemSounds& sounds() { return *sounds_; }

 private:
  HeadlessScreen screen_;
  PacedDeviceCapture deviceCapture_;
  PacedTapService appAudioTap_;
  HeadlessApplications applications_;
  HeadlessRenderServer renderServer_;
  HeadlessAlerts alerts_;
  HeadlessStatusBar statusBar_;
  const std::unique_ptr<SystemSounds> sounds_;
};

}  // namespace qv::platform
