#include "daemon/StartDesk.h"

#include <set>

#include "platform/threads/Log.h"
#include "support/QVBundleTexts.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
namespace logs = platform::logs;

namespace {

constexpr double kLargestSide = 1e6;  // pixels; beyond it a size is nonsense, not a wish

/// Not what is no number either.
bool isSaneSide(double side) { return side >= 1 && side <= kLargestSide; }

}  // namespace

void StartDesk::startRecordingWindowLayerContextIDs(const Caller& caller, const request::StartRecording& request,
                                                    const platform::IPCReply& reply) {
  if (const auto error = checkStartIsAllowed(caller, request)) {
    StartAnswer(services_.context.errors, reply).refused(*error);
    return;
  }
  const auto session = services_.sessions.find(caller.bundleID());
  const std::string& bundleID = session->bundleID();
  const auto flow = std::make_shared<StartFlow>(services_, session, request, reply,
                                                [this, bundleID] { pendingStarts_.erase(bundleID); });
  pendingStarts_[bundleID] = flow;
  flow->run();
}

/// The checks that leave everything as it is.
std::optional<Error> StartDesk::checkStartIsAllowed(const Caller& caller,
                                                    const request::StartRecording& request) const {
  const Error failedToStart = recordingError(errorcode::kFailedToStart);
  if (!services_.sessions.find(caller.bundleID())) {
    QV_LOG_ERROR(logs::kDaemon,
                 "a recording was requested by process %d, which belongs to no application bundle: put the "
                 "executable below a directory with an Info.json that has a CFBundleIdentifier, in an installed "
                 "bundle root or one named by QUORVEL_BUNDLE_PATH",
                 static_cast<int>(caller.connection->processIdentifier()));
    return failedToStart;
  }
  if (request.systemRecording && !caller.isPrivileged()) return recordingError(errorcode::kEntitlements);
  if (!request.systemRecording && !checkContextIDsMatch(caller, request.contextIDs)) return failedToStart;
  if (!isSaneSide(request.windowSize.width) || !isSaneSide(request.windowSize.height)) {
    QV_LOG_ERROR(logs::kDaemon, "window size %f x %f cannot be recorded", request.windowSize.width,
                 request.windowSize.height);
    return failedToStart;
  }
  if (pendingStarts_.contains(*caller.bundleID())) {
    QV_LOG(logs::kDaemon, "another start of this application is still on its way");
    return failedToStart;
  }
  return std::nullopt;
}

bool StartDesk::isOfCallersApplication(const Caller& caller, pid_t processID) const {
  const auto bundle = services_.context.texts.bundleWithPID(processID);
  return bundle && caller.is(bundle->bundleIdentifier()) &&
         services_.context.platform.bundles->userOfProcess(processID) == caller.user();
}

bool StartDesk::checkContextIDsMatch(const Caller& caller, const std::vector<uint32_t>& contextIDs) const {
  const std::set<uint32_t> distinct(contextIDs.begin(), contextIDs.end());
  if (distinct.size() > kMostContextIDs) {
    QV_LOG_ERROR(logs::kDaemon, "a start names %zu windows, %zu are the most", distinct.size(), kMostContextIDs);
    return false;
  }
  for (const uint32_t contextID : distinct) {
    const auto owner = services_.context.platform.renderServer->ownerOfContext(contextID);
    if (!owner || !isOfCallersApplication(caller, *owner)) return false;
  }
  return true;
}

void StartDesk::cancelPendingStart(const std::string& bundleID) {
  const auto pending = pendingStarts_.find(bundleID);
  if (pending == pendingStarts_.end()) return;
  const auto flow = pending->second;
  flow->cancel();
}

void StartDesk::recordingEnded(const QVRecording& recording) {
  const auto pending = pendingStarts_.find(recording.settings().bundleID);
  if (pending != pendingStarts_.end() && pending->second->recording().get() == &recording)
    pendingStarts_.erase(pending);
}

}  // namespace qv
