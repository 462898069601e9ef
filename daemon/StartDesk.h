#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/StartFlow.h"

namespace qv {

/// Takes starts in: checks them without changing anything, and keeps each while it is on its way, one for an
/// application.
///
/// Threading: sequence only.
class StartDesk {
 public:
  /// Windows that one start may name.
  static constexpr size_t kMostContextIDs = 64;
  explicit StartDesk(StartServices services) : services_(std::move(services)) {}

  void startRecordingWindowLayerContextIDs(const Caller& caller, const request::StartRecording& request,
                                           const platform::IPCReply& reply);
  /// Whether a process belongs to the caller's application: the same bundle, under the same user.
  [[nodiscard]] bool isOfCallersApplication(const Caller& caller, pid_t processID) const;
  /// Whether all these windows are the caller's own. Each is asked for once.
  [[nodiscard]] bool checkContextIDsMatch(const Caller& caller, const std::vector<uint32_t>& contextIDs) const;
  /// The client of this application has gone.
  void cancelPendingStart(const std::string& bundleID);
  /// Its start is over with it.
  void recordingEnded(const QVRecording& recording);

 private:
  [[nodiscard]] std::optional<platform::Error> checkStartIsAllowed(const Caller& caller,
                                                                   const request::StartRecording& request) const;

  StartServices services_;
  std::map<std::string, std::shared_ptr<StartFlow>> pendingStarts_;
};

}  // namespace qv
