#include "daemon/ChosenServices.h"

namespace qv {

platform::DeviceServices ChosenServices::look() {
  platform::DeviceServices found;
  found.display = display_ != nullptr ? platform::ServiceState{"X11", display_->whyNotThere()}
                                      : platform::ServiceState{"headless", displayFault_};
  found.sound = sound_.state();
  found.movies = {"libavcodec", movies_.whyNotThere()};
  return found;
}

}  // namespace qv
