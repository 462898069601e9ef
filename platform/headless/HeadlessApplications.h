#pragma once

#include <memory>

#include "platform/Applications.h"
#include "platform/RenderServer.h"

namespace qv::platform {

/// Applications of a device without windows: whatever is asked about is in the foreground, and
/// which one is frontmost is said by `setFrontmostApplication`.
///
/// Threading: thread-safe. Monitors may outlive the service.
class HeadlessApplications final : public ApplicationService {
 public:
  using ProcessLookup = std::function<std::optional<pid_t>(const std::string& bundleID)>;

  /// `processOfBundle` gives the process id of reports; it may be empty.
  HeadlessApplications(ProcessLookup processOfBundle, std::optional<std::string> frontmost);
  ~HeadlessApplications() override;
  std::unique_ptr<ApplicationStateMonitor> createStateMonitor() override;
  std::optional<std::string> frontmostApplication() override;
  /// Reports the application that left the front and the one that came to it.
  void setFrontmostApplication(std::optional<std::string> bundleID);

  struct State;

 private:
  const std::shared_ptr<State> state_;
};

/// Contexts of a device without windows: context N belongs to process N while that runs.
///
/// Threading: thread-safe.
class HeadlessRenderServer final : public RenderServer {
 public:
  std::optional<pid_t> ownerOfContext(uint32_t contextID) override;
};

}  // namespace qv::platform
