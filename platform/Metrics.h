#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/base/Error.h"
#include "platform/base/Value.h"

namespace qv::platform {

/// One usage-metrics message.
struct MetricsMessage {
  int32_t clientType = 0;
  int32_t clientVersion = 0;
  int64_t sessionID = 0;
  bool batchEvent = false;
  bool userInfoRequired = false;
  std::string clientName;
  std::string serviceName;
  uint16_t category = 0;
  uint16_t type = 0;
  Dictionary payload;
  /// Pictures that the recording's output had no room for; nothing where it counts none.
  std::optional<uint64_t> droppedPictures = std::nullopt;
};

/// Threading: thread-safe.
class MetricsReporter {
 public:
  virtual ~MetricsReporter() = default;
  /// No error on success.
  virtual std::optional<Error> sendMessage(const MetricsMessage& message) = 0;
};

}  // namespace qv::platform
