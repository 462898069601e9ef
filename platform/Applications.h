#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/base/Value.h"

namespace qv::platform {

/// Entries of an application state report.
namespace applicationstate {
inline constexpr const char kStateKey[] = "state";                ///< uint32, see ApplicationState
inline constexpr const char kProcessIDKey[] = "processID";        ///< int32
inline constexpr const char kIsFrontmostKey[] = "isFrontmost";    ///< bool
inline constexpr const char kBundleIDKey[] = "bundleIdentifier";  ///< string
}  // namespace applicationstate

/// State bits of an application. A state of exactly Terminated means that its process has ended.
enum ApplicationState : uint32_t {
  kApplicationUnknown = 0,
  kApplicationTerminated = 1,
  kApplicationSuspended = 2,
  kApplicationBackground = 4,
  kApplicationForeground = 8,
};

/// Watches which applications run and which is in front.
///
/// Threading: thread-safe. The handler is called on the monitor's own thread.
class ApplicationStateMonitor {
 public:
  virtual ~ApplicationStateMonitor() = default;
  /// The state bits of an application; kApplicationUnknown when none of its processes is known.
  [[nodiscard]] virtual uint32_t applicationStateForBundleIdentifier(const std::string& bundleID) = 0;
  /// Answers with the application's report, or an empty dictionary when it is not running.
  virtual void applicationInfoForBundleIdentifier(const std::string& bundleID,
                                                  std::function<void(Dictionary)> handler) = 0;
  /// Called with a report at each change of an application's state or of the front. An empty
  /// function removes the handler; then no report is in progress any more when this returns
  /// (unless called from one).
  virtual void setHandler(std::function<void(const Dictionary&)> handler) = 0;
};

/// What is in front, and who owns which layer context (window).
///
/// Threading: thread-safe.
class ApplicationService {
 public:
  virtual ~ApplicationService() = default;
  virtual std::unique_ptr<ApplicationStateMonitor> createStateMonitor() = 0;
  /// The bundle identifier of the frontmost application; nothing when there is none.
  [[nodiscard]] virtual std::optional<std::string> frontmostApplication() = 0;
};

}  // namespace qv::platform
