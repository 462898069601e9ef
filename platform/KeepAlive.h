#pragma once

namespace qv::platform {

/// While at least one transaction is open, the platform keeps the daemon running and the device
/// from idling to sleep. Unbalanced closes are ignored with a log line.
///
/// Threading: thread-safe.
class KeepAliveService {
 public:
  virtual ~KeepAliveService() = default;
  virtual void beginTransaction() = 0;
  virtual void endTransaction() = 0;
};

}  // namespace qv::platform
