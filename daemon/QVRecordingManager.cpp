#include "daemon/QVRecordingManager.h"

#include "daemon/StartRequest.h"
#include "daemon/client/QVDaemonProtocol.h"
#include "extensions/QVExtensionHostContext.h"
#include "platform/Log.h"
#include "support/QVTemporaryFiles.h"
#include "support/QVUnfinishedMovies.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
namespace logs = platform::logs;

namespace {
constexpr const char kPurgeServiceName[] = "com.tarnwick.quorveld-cache-delete";
constexpr double kTimeToLive = 86400.0;  // seconds
constexpr int32_t kUrgencyStopsRecording = 3;
}  // namespace

std::shared_ptr<QVRecordingManager> QVRecordingManager::create(QVCaptureManager& captureManager) {
  std::shared_ptr<QVRecordingManager> manager(new QVRecordingManager(captureManager));
  manager->registerPurgeableSpace();
  return manager;
}

QVRecordingManager::QVRecordingManager(QVCaptureManager& captureManager)
    : platform_(platform::Platform::current()),
      captureManager_(captureManager),
      sequence_("com.tarnwick.quorveld.manager", *platform_.globalQueue) {
  _srSetupTempDirectory();
  _srSalvageUnfinishedMovies();
  publicListener_ = platform_.ipc->createListener(kServiceName);
  publicListener_->setDelegate(this, sequence_);
  if (platform_.extensions) QVExtensionHostContext::registerWith(*platform_.extensions);
  applicationStateMonitor_ = platform_.applications->createStateMonitor();
}

QVRecordingManager::~QVRecordingManager() {
  if (!layoutMonitor_) return;
  layoutMonitor_->removeObserver(this);
  layoutMonitor_->invalidate();
}

std::optional<Error> QVRecordingManager::finishStartup() { return publicListener_->resume(); }

void QVRecordingManager::setLayoutMonitor(std::shared_ptr<platform::DisplayLayoutMonitor> monitor) {
  sequence_.sync([&] { layoutMonitor_ = std::move(monitor); });
}

void QVRecordingManager::shutDown(std::function<void()> handler) {
  sequence_.async([self = shared_from_this(), handler = std::move(handler)] {
    // The handler runs when the last finish has let go of this.
    const std::shared_ptr<void> whenAllFinished(nullptr, [handler](void*) { handler(); });
    for (const auto& [bundleID, session] : self->bundleIDToRecordingSessionLookup_) {
      if (!session->isRecording()) continue;
      self->finishRecording(session, 0, 0, [whenAllFinished](const auto&, const auto&) {});
    }
  });
}

std::shared_ptr<QVRecordingSession> QVRecordingManager::recordingSessionForBundleID(
    const std::optional<std::string>& bundleID) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:recordingSessionForBundleID");
  if (!bundleID) return nullptr;
  const auto found = bundleIDToRecordingSessionLookup_.find(*bundleID);
  if (found != bundleIDToRecordingSessionLookup_.end()) return found->second;
  QV_LOG(logs::kDaemon, "no session, creating a new one");
  auto session = std::make_shared<QVRecordingSession>(*bundleID, sequence_, captureManager_);
  bundleIDToRecordingSessionLookup_.emplace(*bundleID, session);
  return session;
}

void QVRecordingManager::removeSessionForBundleID(const std::string& bundleID) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:removeSessionForBundleID");
  bundleIDToRecordingSessionLookup_.erase(bundleID);
}

std::optional<std::string> QVRecordingManager::getCallingConnectionBundleID() const {
  return callingConnection_ ? callingConnection_->peer().bundleIdentifier : std::nullopt;
}

std::shared_ptr<QVRecordingSession> QVRecordingManager::getCallingConnectionRecordingSession() const {
  const auto bundleID = getCallingConnectionBundleID();
  if (!bundleID) return nullptr;
  const auto found = bundleIDToRecordingSessionLookup_.find(*bundleID);
  return found == bundleIDToRecordingSessionLookup_.end() ? nullptr : found->second;
}

void QVRecordingManager::beginTransaction() { platform_.keepAlive->beginTransaction(); }
void QVRecordingManager::endTransaction() { platform_.keepAlive->endTransaction(); }

void QVRecordingManager::registerPurgeableSpace() {
  const auto answer = [weakSelf = weak_from_this()](const std::function<int64_t(QVRecordingManager&)>& work) {
    const auto self = weakSelf.lock();
    return self ? self->sequence_.syncResult<int64_t>([&] { return work(*self); }) : int64_t{0};
  };
  platform::PurgeableSpaceCallbacks callbacks;
  callbacks.purgeable = [answer](int32_t) {
    return answer([](QVRecordingManager& manager) { return manager.purgeableSpace(); });
  };
  callbacks.purge = [answer](int64_t, int32_t urgency) {
    return answer([urgency](QVRecordingManager& manager) { return manager.purge(urgency); });
  };
  callbacks.cancel = [] {};
  callbacks.periodic = [answer](int64_t, int32_t) {
    return answer([](QVRecordingManager& manager) { return manager.purgePeriodically(); });
  };
  platform_.purgeableSpace->registerCallbacks(kPurgeServiceName, std::move(callbacks));
}

int64_t QVRecordingManager::purgeableSpace() {
  QV_LOG(logs::kDaemon, "QVRecordingManager: cache delete purgeable space callback");
  std::optional<Error> error;
  return _srSizeOfTempDir(&error);
}

int64_t QVRecordingManager::purge(int32_t urgency) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: cache delete purge callback");
  Session found;
  for (const auto& [bundleID, session] : bundleIDToRecordingSessionLookup_) {
    if (session->isRecording()) found = session;
  }
  if (urgency >= kUrgencyStopsRecording) {
    if (found && found->isRecording()) {
      const uint64_t generation = found->generation();
      stopRecordingSession(found, 0, 0, nullptr);
      recordingSessionStoppedWithErrorMovieURL(found,
                                               {generation, _qvUserErrorForCode(errorcode::kInsufficientStorage)});
    }
    return _srDeleteAllTempFiles();
  }
  // Only a recording that stopped while it was looked at leaves files that may go.
  if (!found || found->isRecording()) return 0;
  return _srDeleteFilesOlderThanTimeToLiveInSeconds(kTimeToLive);
}

int64_t QVRecordingManager::purgePeriodically() {
  QV_LOG(logs::kDaemon, "QVRecordingManager: cache delete periodic callback");
  return _srDeleteFilesOlderThanTimeToLiveInSeconds(kTimeToLive);
}

}  // namespace qv
