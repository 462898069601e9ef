#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace qv::platform {

/// Asks this process to give up disk space, urgently from 1 to 3: at 1 what is of no use to anybody goes, at 2 whoever
/// fills the disk stops and keeps what is made (movie recordings end and keep their movies), at 3 all goes that can.
/// Callbacks return a byte amount and may come on any thread.
struct PurgeableSpaceCallbacks {
  std::function<int64_t(int32_t urgency)> purgeable;
  std::function<int64_t(int64_t amount, int32_t urgency)> purge;
  std::function<void()> cancel;
  std::function<int64_t(int64_t amount, int32_t urgency)> periodic;
};

class PurgeableSpaceService {
 public:
  virtual ~PurgeableSpaceService() = default;
  virtual void registerCallbacks(const std::string& serviceName, PurgeableSpaceCallbacks callbacks) = 0;
};

}  // namespace qv::platform
