#include "daemon/QVRecordingManager.h"
#include "daemon/StartRequest.h"
#include "platform/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Array;
using platform::Error;
using platform::IPCArguments;
using platform::IPCReply;
using platform::Value;
namespace logs = platform::logs;

/// An application sets up its own broadcasts; those of others only the system does.
void QVRecordingManager::setupBroadcastWithHostBundleID(const IPCArguments& arguments, const IPCReply& reply) {
  QVBroadcastBook::SetupRequest request;
  request.hostBundleID = arguments[0].asString();
  request.extensionBundleID = arguments[1].asString();
  request.configuration = arguments[2].asData();
  request.userInfo = arguments[3].asDictionary();
  if (getCallingConnectionBundleID() != request.hostBundleID &&
      !callingConnection_->valueForEntitlement(kPrivateEntitlement).asBool()) {
    QV_LOG_ERROR(logs::kDaemon, "a broadcast of %s was set up by another application", request.hostBundleID.c_str());
    reply({Value(platform::encodeError(_qvUserErrorForCode(errorcode::kEntitlements)))});
    return;
  }
  const auto session = bundleIDToRecordingSessionLookup_.find(request.hostBundleID);
  if (session != bundleIDToRecordingSessionLookup_.end()) request.generation = session->second->generation() + 1;
  broadcasts_->setupBroadcast(
      std::move(request), [reply](const std::optional<Error>& error) { reply({Value(platform::encodeError(error))}); });
}

void QVRecordingManager::getCurrentBroadcastImages(const IPCArguments&, const IPCReply& reply) {
  reply({Value(broadcasts_->currentHostAppImage()), Value(broadcasts_->currentExtensionAppImage())});
}

void QVRecordingManager::getSystemBroadcastExtensionInfo(const IPCArguments&, const IPCReply& reply) {
  broadcasts_->getSystemBroadcastExtensionInfo([reply](Array extensions, const std::optional<Error>& error) {
    reply({Value(std::move(extensions)), Value(platform::encodeError(error))});
  });
}

/// The start waits until the extension is ready, or is known not to become so; the manager does not. The transaction is
/// open.
void QVRecordingManager::enableBroadcast(const Start& start) {
  QV_LOG(logs::kDaemon, "broadcast requested");
  const Session& session = start->session;
  const QVBroadcastInfo* info = broadcasts_->infoForHostBundleID(session->bundleID());
  if (!info) {
    QV_LOG(logs::kDaemon, "attempted to start broadcast without a session, bailing out");
    endTransaction();
    refuseStart(start, Error{kQVRecordingErrorDomain, errorcode::kInvalidBroadcastSession, {}});
    return;
  }
  QV_LOG(logs::kDaemon, "found broadcast info, enabling for session");
  session->setBroadcastConfiguration(info->extensionConfiguration);
  session->enableBroadcastWithExtension(info->extension, info->extensionProcessMode, info->extensionUserInfo,
                                        start->listenerEndpoint,
                                        [weakSelf = weak_from_this(), start](const std::optional<Error>& error) {
                                          const auto self = weakSelf.lock();
                                          if (self) self->continueStartAfterEnabling(start, error);
                                        });
}

/// Without its extension the session records as it would without a broadcast; so the user, who was not asked about a
/// broadcast, is asked now.
void QVRecordingManager::continueStartAfterEnabling(const Start& start, const std::optional<Error>& error) {
  if (start->isOver) {
    endTransaction();
    start->session->abandonBroadcast();
    return;
  }
  if (!start->systemRecording && !isApplicationInForegroundWithBundleIdentifier(start->session->bundleID())) {
    QV_LOG(logs::kDaemon, "app is not in the foreground, calling handler with error");
    endTransaction();
    start->session->abandonBroadcast();
    refuseStart(start, _qvUserErrorForCode(errorcode::kFailedToStart));
    return;
  }
  if (!error) {
    recordWhatIsFrontmost(start);
    return;
  }
  QV_LOG_ERROR(logs::kDaemon, "the broadcast extension is not available, recording without it: %s",
               error->description().c_str());
  endTransaction();
  start->broadcast = false;
  if (start->systemRecording) {
    beginRecording(start);
  } else {
    showAcknowledgementAlertForSession(start);
  }
}

}  // namespace qv
