#pragma once

#include <optional>

#include "daemon/SoundChoice.h"
#include "platform/DeviceServices.h"
#include "platform/ffmpeg/MoviesLoader.h"
#include "platform/x11/X11Platform.h"

namespace qv {

/// Looks at the services that were chosen for this daemon.
///
/// Threading: as its contract says; `setDisplay` before anybody asks. All that it is given is borrowed.
class ChosenServices final : public platform::DeviceServicesQuery {
 public:
  ChosenServices(SoundChoice& sound, const platform::ffmpeg::MoviesLoader& movies) : sound_(sound), movies_(movies) {}

  /// Null where the headless screen was taken; then `fault` tells why the display did not answer, if one was named.
  void setDisplay(platform::X11Platform* display, std::optional<platform::Error> fault) {
    display_ = display;
    displayFault_ = std::move(fault);
  }
  [[nodiscard]] platform::DeviceServices look() override;

 private:
  SoundChoice& sound_;
  const platform::ffmpeg::MoviesLoader& movies_;
  platform::X11Platform* display_ = nullptr;
  std::optional<platform::Error> displayFault_;
};

}  // namespace qv
