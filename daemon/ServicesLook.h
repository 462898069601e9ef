#pragma once

#include <functional>
#include <memory>
#include <vector>

#include "platform/Platform.h"

namespace qv {

/// Looks at the device's services for whoever asks, on the background queue: a server that hangs holds nothing else up.
/// One look goes on at a time, however many ask; whoever asks meanwhile gets what it finds.
///
/// Threading: sequence only. It must be held by a shared pointer. The platform is borrowed.
class ServicesLook : public std::enable_shared_from_this<ServicesLook> {
 public:
  using Handler = std::function<void(const platform::DeviceServices&)>;
  ServicesLook(const platform::Platform& platform, platform::SerialQueue& sequence)
      : platform_(platform), sequence_(sequence) {}

  /// The handler runs on the sequence.
  void look(Handler handler);

 private:
  void found(const platform::DeviceServices& services);

  const platform::Platform& platform_;
  platform::SerialQueue& sequence_;
  std::vector<Handler> waiting_;
};

}  // namespace qv
