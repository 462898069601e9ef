#include <algorithm>

#include "daemon/QVRecordingManager.h"
#include "daemon/StartRequest.h"
#include "platform/Log.h"
#include "support/QVTemporaryFiles.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::DisplayLayoutElement;
using platform::Error;
using platform::IPCArguments;
using platform::IPCReply;
using platform::URL;
namespace applicationstate = platform::applicationstate;
namespace logs = platform::logs;

namespace {
constexpr int64_t kOverApplicationsLevel = 2;
constexpr int32_t kNoProcess = -1;
}  // namespace

void QVRecordingManager::interruptOtherRecordingSessionAgainstSession(const Session& session) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:interruptRecordingSessions");
  for (const auto& [bundleID, other] : bundleIDToRecordingSessionLookup_) {
    if (bundleID == session->bundleID() || !other->isRecording()) continue;
    finishRecording(
        other, 0, 0,
        [this, interrupted = other, generation = other->generation()](const auto& movie, const auto& error) {
          QV_LOG(logs::kDaemon, "interrupted session");
          recordingSessionInterruptedWithError(interrupted, {generation, error, movie});
          interrupted->setInterruptedMovieURL(movie);
        });
  }
}

/// Ends one recording's hold on the manager; a later recording of the same session is not touched.
void QVRecordingManager::resetStatesForSession(const Session& session, uint64_t generation) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:resetStatesForSession:");
  if (session->generation() == generation) {
    session->setRecording(false);
    session->setPaused(false);
  }
  broadcasts_->recordingEnded(session->bundleID(), generation);
  if (openTransactions_.erase({session.get(), generation}) > 0) endTransaction();
  if (openTransactions_.empty() && layoutMonitor_) layoutMonitor_->removeObserver(this);
}

std::shared_ptr<void> QVRecordingManager::holdEnding(const std::string& bundleID) {
  ++endings_[bundleID].holds;
  return {nullptr, [weakSelf = weak_from_this(), bundleID](void*) {
            const auto self = weakSelf.lock();
            if (self) self->sequence_.async([self, bundleID] { self->endingReleased(bundleID); });
          }};
}

void QVRecordingManager::endingReleased(const std::string& bundleID) {
  const auto ending = endings_.find(bundleID);
  if (ending == endings_.end() || --ending->second.holds > 0) return;
  const auto waiting = std::move(ending->second.waiting);
  endings_.erase(ending);
  for (const auto& continuation : waiting) continuation();
}

void QVRecordingManager::whenEnded(const std::string& bundleID, std::function<void()> continuation) {
  const auto ending = endings_.find(bundleID);
  if (ending == endings_.end()) {
    continuation();
  } else {
    ending->second.waiting.push_back(std::move(continuation));
  }
}

void QVRecordingManager::clientDidBecomeActive(const IPCArguments&, const IPCReply&) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:clientDidBecomeActiveWithBundleID:");
  const Session session = getCallingConnectionRecordingSession();
  if (!session) return;
  exemptions_.expireAcknowledgementExemptionsForBundleID(session->bundleID(), platform_.clock->now());
  if (!session->isRecording() || !session->interruptedMovieURL()) return;
  QV_LOG(logs::kDaemon, "current session was interrupted - notify client app of error");
  QV_LOG(logs::kDaemon, "QVRecordingManager:recordingSessionStoppedWithError:movieURL:");
  // Of the former recording, and told a second time: now the application can be expected to listen. What
  // it records now goes on.
  const Error interrupted = _qvUserErrorForCode(errorcode::kInterrupted);
  if (const auto proxy = session->clientProxy()) {
    proxy->stopRecordingWithError(interrupted, session->interruptedMovieURL());
  }
  session->setInterruptedMovieURL(std::nullopt);
}

void QVRecordingManager::clientDidResignActive(const IPCArguments&, const IPCReply&) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:clientDidResignActiveWithBundleID:");
  if (const Session session = getCallingConnectionRecordingSession()) {
    exemptions_.noteBackground(session->bundleID(), platform_.clock->now());
  }
}

void QVRecordingManager::recordingSessionStoppedWithError(const Session& session, uint64_t generation,
                                                          const std::optional<Error>& error) {
  sequence_.async([self = shared_from_this(), session, generation, error] {
    self->recordingSessionStoppedWithErrorMovieURL(session, {generation, error});
    session->completeMovieAfterFailure(generation, [weakSelf = std::weak_ptr(self), session, generation,
                                                    hold = self->holdEnding(session->bundleID())] {
      const auto manager = weakSelf.lock();
      if (!manager) return;
      manager->sequence_.async([manager, session, generation, hold] {
        manager->resetStatesForSession(session, generation);
        manager->replaceSessionAfterMediaServicesReset(session);
      });
    });
  });
}

/// A session that saw the display server go passes no video any more: the next recording gets a new one.
void QVRecordingManager::replaceSessionAfterMediaServicesReset(const Session& session) {
  const auto registered = bundleIDToRecordingSessionLookup_.find(session->bundleID());
  if (!session->shouldStop() || registered == bundleIDToRecordingSessionLookup_.end()) return;
  if (registered->second != session || session->isRecording()) return;
  auto fresh = std::make_shared<QVRecordingSession>(session->bundleID(), sequence_, captureManager_);
  fresh->setClientProxy(session->clientProxy());
  fresh->setHasUserConsentForCamera(session->hasUserConsentForCamera());
  fresh->setHasUserConsentForMicrophone(session->hasUserConsentForMicrophone());
  fresh->setMicrophoneEnabledPersistent(session->microphoneEnabledPersistent());
  fresh->setBroadcastURL(session->broadcastURL());
  registered->second = std::move(fresh);
}

void QVRecordingManager::recordingSessionStoppedWithErrorMovieURL(const Session& session, const RecordingEnd& end) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:recordingSessionStoppedWithError:movieURL:");
  alertUserOfEnd(session, end.error);
  clearSystemRecordingUI(session);
  tellRecordingEnded(session, end);
}

void QVRecordingManager::recordingSessionInterruptedWithError(const Session& session, const RecordingEnd& end) {
  clearSystemRecordingUI(session);
  tellRecordingEnded(session, end);
}

/// Once for each recording, whichever of several ways it ended on comes here first. A client that was
/// not told yet that its recording began learns of the end as the answer to its start.
void QVRecordingManager::tellRecordingEnded(const Session& session, const RecordingEnd& end) {
  if (!session->takeEndReport(end.generation)) return;
  if (const Start start = unansweredStart(session, end.generation)) {
    if (end.movie) _srRemoveFile(*end.movie, nullptr);
    refuseStart(start, end.error.value_or(_qvUserErrorForCode(errorcode::kInterrupted)));
    return;
  }
  if (end.movie) handMovieTo(session->bundleID(), *end.movie);
  if (const auto proxy = session->clientProxy()) proxy->stopRecordingWithError(end.error, end.movie);
}

void QVRecordingManager::broadcastSessionDidUpdateServiceInfo(const Session& session, const Dictionary& serviceInfo) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:broadcastSessionDidUpdateServiceInfo:");
  if (const auto proxy = session->clientProxy()) proxy->updateBroadcastServiceInfo(serviceInfo);
}

void QVRecordingManager::broadcastSessionDidUpdateDuration(QVRecordingSession&, double) {}

/// The layout in which a recording begins is the one that it belongs to: what was counted during a former one says
/// nothing about it.
void QVRecordingManager::observeDisplayLayout() {
  if (!layoutMonitor_) return;
  previousElementCount_ = 0;
  layoutMonitor_->addObserver(weak_from_this());
}

void QVRecordingManager::layoutMonitorDidUpdateDisplayLayout(platform::DisplayLayoutMonitor&,
                                                             const platform::DisplayLayout& layout) {
  sequence_.async(weak_from_this(), [layout](QVRecordingManager& manager) { manager.applyDisplayLayout(layout); });
}

void QVRecordingManager::applyDisplayLayout(const platform::DisplayLayout& layout) {
  const auto& elements = layout.elements;
  const auto isOrdinary = [](const DisplayLayoutElement& element) { return element.level < kOverApplicationsLevel; };
  int64_t count = 0;
  bool stop = false;
  if (elements.size() == 1) {
    stop = previousElementCount_ > 1;
  } else {
    count = std::count_if(elements.begin(), elements.end(), isOrdinary);
    stop = count == static_cast<int64_t>(elements.size());
  }
  previousElementCount_ = count;
  if (!stop) return;
  for (const auto& [bundleID, session] : bundleIDToRecordingSessionLookup_) {
    if (!session->isRecording() || session->isSystemRecording()) continue;
    finishRecording(session, 0, 0,
                    [this, ended = session, generation = session->generation()](const auto& movie, const auto&) {
                      const Error resized = _qvUserErrorForCode(errorcode::kContentResize);
                      recordingSessionStoppedWithErrorMovieURL(ended, {generation, resized, movie});
                    });
  }
}

void QVRecordingManager::installForegroundFollower(const Session& session) {
  followedSession_ = session;
  applicationStateMonitor_->setHandler(
      [weakSelf = weak_from_this(), weakSession = std::weak_ptr(session)](const Dictionary& report) {
        const auto self = weakSelf.lock();
        if (!self) return;
        self->sequence_.async([self, weakSession, report] {
          const auto followed = weakSession.lock();
          if (followed && followed == self->followedSession_) self->followForeground(followed, report);
        });
      });
  lookAtForeground(session);
}

/// The front may have changed between the question at the start and the follower's first look.
void QVRecordingManager::lookAtForeground(const Session& session) {
  frontmostSession(session, [weakSelf = weak_from_this(), session](int32_t processID) {
    const auto self = weakSelf.lock();
    if (!self || self->followedSession_ != session) return;
    const bool isSilent = processID < 1 && session->frontmostPIDForAudioTap() < 1;
    if (!isSilent && processID != session->frontmostPIDForAudioTap()) {
      session->updateProcessIDForAudioCaptureWithPID(processID);
    }
  });
}

/// The audio of a system recording is that of the application in front.
void QVRecordingManager::followForeground(const Session& session, const Dictionary& report) {
  const auto processID =
      static_cast<int32_t>(platform::valueForKey(report, applicationstate::kProcessIDKey).asInteger(kNoProcess));
  if (platform::valueForKey(report, applicationstate::kStateKey).asInteger() == platform::kApplicationTerminated) {
    session->checkAndStopAppAudioForPID(processID);
  }
  if (platform::valueForKey(report, applicationstate::kIsFrontmostKey).asBool()) {
    session->updateProcessIDForAudioCaptureWithPID(processID);
  } else if (processID == session->frontmostPIDForAudioTap()) {
    session->updateProcessIDForAudioCaptureWithPID(kNoProcess);
  }
}

}  // namespace qv
