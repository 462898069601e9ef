#include <utility>

#include "daemon/QVRecordingManager.h"
#include "platform/threads/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::IPCReply;
using platform::Value;
namespace logs = platform::logs;

namespace {

Dictionary stateOf(const QVRecordingSession& session) {
  Dictionary state{
      {"isRecording", Value(session.isRecording())},
      {"isBroadcasting", Value(session.isBroadcasting())},
      {"microphoneEnabled", Value(session.microphoneEnabled())},
      {"isSystemRecording", Value(session.isSystemRecording())},
      {"hasUserConsentForMicrophone", Value(session.hasUserConsentForMicrophone())},
      {"hasUserConsentForCamera", Value(session.hasUserConsentForCamera())},
      {"microphoneEnabledPersistent", Value(session.microphoneEnabledPersistent())},
  };
  if (session.broadcastURL()) state.emplace("broadcastURL", Value(*session.broadcastURL()));
  return state;
}

}  // namespace

void QVRecordingManager::addApplicationRequests() {
  const auto withSession = [this](auto serve) {
    return [this, serve](const Caller& caller, const auto& request, const IPCReply&) {
      if (const Session session = sessions_->find(caller.bundleID())) serve(*session, request);
    };
  };
  requests_.add<request::DidBecomeActive>([this](const Caller& caller, const auto&, const IPCReply&) {
    QV_LOG(logs::kDaemon, "QVRecordingManager:clientDidBecomeActiveWithBundleID:");
    if (const Session session = sessions_->find(caller.bundleID())) clientDidBecomeActive(session);
  });
  requests_.add<request::DidResignActive>([this](const Caller& caller, const auto&, const IPCReply&) {
    QV_LOG(logs::kDaemon, "QVRecordingManager:clientDidResignActiveWithBundleID:");
    if (caller.bundleID()) exemptions_.noteBackground(caller.owner(), platform_.clock->now());
  });
  requests_.add<request::GetState>([this](const Caller& caller, const auto&, const IPCReply& reply) {
    const Session session = sessions_->find(caller.bundleID());
    reply({Value(session ? stateOf(*session) : Dictionary{})});
  });
  requests_.add<request::SetCameraConsent>(
      withSession([](auto& session, const auto& request) { session.setHasUserConsentForCamera(request.consent); }));
  requests_.add<request::SetMicrophoneConsent>(
      withSession([](auto& session, const auto& request) { session.setHasUserConsentForMicrophone(request.consent); }));
  requests_.add<request::SetBroadcastURL>(withSession([](auto& session, const auto& request) {
    const std::string& url = request.broadcastURL;
    session.setBroadcastURL(url.empty() ? std::nullopt : std::optional(url));
  }));
  requests_.add<request::SetMicrophoneEnabledPersistent>(
      withSession([](auto& session, const auto& request) { session.setMicrophoneEnabledPersistent(request.enabled); }));
}

/// Of a former recording, and told a second time: now the application can be expected to listen. What it records now
/// goes on. A movie that is gone, saved, or replaced by now is not named.
void QVRecordingManager::clientDidBecomeActive(const Session& session) {
  exemptions_.expireAcknowledgementExemptionsForBundleID(session->owner(), platform_.clock->now());
  if (!session->isRecording() || !session->interruptedMovieURL()) return;
  auto movie = session->interruptedMovieURL();
  session->setInterruptedMovieURL(std::nullopt);
  if (!context_->movies->isHandedTo(session->owner(), *movie)) movie.reset();
  QV_LOG(logs::kDaemon, "current session was interrupted - notify client app of error");
  QV_LOG(logs::kDaemon, "QVRecordingManager:recordingSessionStoppedWithError:movieURL:");
  if (const auto proxy = session->clientProxy()) {
    proxy->stopRecordingWithError(recordingError(errorcode::kInterrupted), movie);
  }
}

void QVRecordingManager::addBroadcastRequests() {
  requests_.addIdentified<request::SetupBroadcast>(
      [this](const Caller& caller, const auto& request, const IPCReply& reply) {
        setupBroadcast(caller, request, reply);
      },
      [this](const auto&, const IPCReply& reply) {
        reply({Value(context_->errors.encoded(recordingError(errorcode::kEntitlements)))});
      });
  requests_.add<request::GetBroadcastImages>([this](const Caller&, const auto&, const IPCReply& reply) {
    reply({Value(broadcasts_->currentHostAppImage()), Value(broadcasts_->currentExtensionAppImage())});
  });
  requests_.add<request::GetBroadcastExtensions>([this](const Caller&, const auto&, const IPCReply& reply) {
    broadcasts_->getSystemBroadcastExtensionInfo(
        [reply, context = context_](platform::Array extensions, const std::optional<Error>& error) {
          reply({Value(std::move(extensions)), Value(context->errors.encoded(error))});
        });
  });
}

/// An application sets up its own broadcasts; those of others only the system does. One that is not there now is
/// expected under the caller's user.
void QVRecordingManager::setupBroadcast(const Caller& caller, const request::SetupBroadcast& request,
                                        const IPCReply& reply) {
  if (!caller.is(request.hostBundleID) && !caller.isPrivileged()) {
    QV_LOG_ERROR(logs::kDaemon, "a broadcast of %s was set up by another application", request.hostBundleID.c_str());
    reply({Value(context_->errors.encoded(recordingError(errorcode::kEntitlements)))});
    return;
  }
  const Session session = sessions_->find(request.hostBundleID);
  QVBroadcastBook::SetupRequest setup{
      request.hostBundleID,
      applicationOwner(request.hostBundleID, session ? session->userIdentifier() : caller.user()),
      request.broadcastExtensionBundleID,
      request.broadcastConfigurationData,
      request.userInfo,
      {}};
  if (session) setup.before = session->recording();
  broadcasts_->setupBroadcast(std::move(setup), [reply, context = context_](const std::optional<Error>& error) {
    reply({Value(context->errors.encoded(error))});
  });
}

}  // namespace qv
