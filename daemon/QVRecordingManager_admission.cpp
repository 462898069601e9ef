#include "daemon/QVRecordingManager.h"
#include "platform/threads/Log.h"
#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "protocol/QVStatusProtocol.h"

namespace qv {

using platform::IPCConnection;
namespace logs = platform::logs;

bool QVRecordingManager::listenerShouldAcceptNewConnection(platform::IPCListener&,
                                                           const std::shared_ptr<IPCConnection>& connection) {
  const uid_t user = connection->peer().userIdentifier;
  const platform::LogQuotas::Scope lines(logQuotas_, user);
  QV_LOG(logs::kDaemon, "QVRecordingManager: shouldAcceptNewConnection:");
  const pid_t processID = connection->processIdentifier();
  if (processID == 0) return false;
  const std::optional<std::string> bundleID = connection->peer().bundleIdentifier;
  if (const Session other = sessions_->livingOfAnotherUser(bundleID, user)) {
    QV_LOG_ERROR(logs::kDaemon, "process %d of user %u is refused: %s is in use by user %u",
                 static_cast<int>(processID), user, bundleID->c_str(), other->userIdentifier());
    return false;
  }
  QV_LOG(logs::kDaemon, "accepted client connection PID: %d", static_cast<int>(processID));
  connection->setExportedInterface(daemonProtocol(), shared_from_this());
  connection->setExportedInterface(statusProtocol(), std::shared_ptr<StatusDesk>(shared_from_this(), &status_));
  connection->setRemoteInterface(clientProtocol());
  connection->setTargetQueue(sequence_);
  const std::weak_ptr<IPCConnection> weakConnection = connection;
  connection->setInterruptionHandler([weakSelf = weak_from_this(), weakConnection] {
    if (const auto self = weakSelf.lock()) self->connectionEnded(weakConnection, "connection INTERRUPTED");
  });
  connection->setInvalidationHandler([weakSelf = weak_from_this(), weakConnection] {
    if (const auto self = weakSelf.lock()) self->connectionEnded(weakConnection, "connection INVALID");
  });
  connections_.emplace(connection, bundleID);
  if (const Session session = sessions_->recordingSessionForBundleID(bundleID, user)) {
    session->setDelegate(weak_from_this());
    adoptConnection(session, *bundleID, connection);
  }
  connection->resume();
  if (bundleID) {
    exemptions_.expireAcknowledgementExemptionsForBundleID(applicationOwner(*bundleID, user), platform_.clock->now());
  }
  return true;
}

/// An application that connects anew replaces its former connection; the end of that one must not
/// tear down the session. Both are the same user's.
void QVRecordingManager::adoptConnection(const Session& session, const std::string& bundleID,
                                         const std::shared_ptr<IPCConnection>& connection) {
  if (const auto proxy = session->clientProxy()) {
    if (const auto former = proxy->connection()) {
      former->setInvalidationHandler(nullptr);
      former->setInterruptionHandler(nullptr);
      connections_.erase(former);
      former->invalidate();
    }
    proxy->setConnection(nullptr);
    // Nobody is left to be told how the former connection's start ended.
    starts_.cancelPendingStart(bundleID);
  }
  session->setClientProxy(std::make_shared<QVClientProxy>(context_->errors, bundleID, connection));
  if (Caller{connection}.isPrivileged()) notices_->systemClientConnected(session->clientProxy());
}

/// Another program is nobody's application, and goes. One that was updated while it runs is still the application: what
/// it records by now goes on, and is its own.
void QVRecordingManager::callerWasRefused(const Caller& caller, platform::PeerStanding standing) {
  const int processID = caller.connection->processIdentifier();
  const std::string bundleID = caller.bundleID().value_or("");
  if (standing == platform::PeerStanding::AnotherProgram) {
    QV_LOG_ERROR(logs::kDaemon, "process %d is no longer the program that connected as %s: its connection ends",
                 processID, bundleID.c_str());
    caller.connection->invalidate();
  } else {
    QV_LOG_ERROR(logs::kDaemon,
                 "the executable of process %d is no longer %s's: it is refused until it is started anew", processID,
                 bundleID.c_str());
  }
}

void QVRecordingManager::connectionEnded(const std::weak_ptr<IPCConnection>& weakConnection, const char* line) {
  const auto connection = weakConnection.lock();
  std::optional<platform::LogQuotas::Scope> lines;
  if (connection) lines.emplace(logQuotas_, connection->peer().userIdentifier);
  QV_LOG(logs::kDaemon, "%s", line);
  const auto known = connections_.find(connection);
  if (known == connections_.end()) return;
  const std::optional<std::string> bundleID = known->second;
  connections_.erase(known);
  applicationDisconnectedWithBundleID(bundleID);
}

void QVRecordingManager::applicationDisconnectedWithBundleID(const std::optional<std::string>& bundleID) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: applicationDisconnected");
  const Session session = sessions_->find(bundleID);
  if (!session) return;
  starts_.cancelPendingStart(*bundleID);
  if (session->isSystemRecording() && session->isRecording()) {
    session->clientProxy()->setConnection(nullptr);
    return;
  }
  stopRecordingSession(session, [](QVRecording& recording) {
    QV_LOG(logs::kDaemon, "recording stopped without handler!");
    recording.finishAndCleanupSessionFiles(std::nullopt);
  });
  sessions_->removeSessionForBundleID(*bundleID);
}

}  // namespace qv
