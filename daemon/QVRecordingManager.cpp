#include "daemon/QVRecordingManager.h"

#include <utility>

#include "extensions/QVExtensionHostContext.h"
#include "platform/threads/Log.h"
#include "protocol/QVDaemonProtocol.h"
#include "support/QVUnfinishedMovies.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
namespace logs = platform::logs;

namespace {
constexpr const char kPurgeServiceName[] = "com.tarnwick.quorveld-cache-delete";
}

std::shared_ptr<QVRecordingManager> QVRecordingManager::create(platform::Platform& platform,
                                                               QVCaptureManager& captureManager) {
  std::shared_ptr<QVRecordingManager> manager(new QVRecordingManager(platform, captureManager));
  manager->registerPurgeableSpace();
  return manager;
}

QVRecordingManager::QVRecordingManager(platform::Platform& platform, QVCaptureManager& captureManager)
    : platform_(platform),
      sequence_("com.tarnwick.quorveld.manager", *platform_.globalQueue),
      context_(std::make_shared<RecordingContext>(platform, sequence_, captureManager)),
      acknowledgements_(*platform_.userAlerts, context_->texts),
      broadcasts_(std::make_shared<QVBroadcastBook>(sequence_, context_)),
      handover_(std::make_shared<MovieHandover>(platform_, sequence_, context_->movies)),
      foreground_(std::make_shared<ForegroundFollower>(*platform_.applications, sequence_)),
      layoutRule_(std::make_shared<DisplayLayoutRule>(
          sequence_, [this] { endRecordingsOfApplications(recordingError(errorcode::kContentResize)); })),
      notices_(std::make_shared<RecordingNotices>(
          context_, [this](const std::shared_ptr<QVRecording>& recording) { stopForUser(recording); })),
      sessions_(std::make_shared<SessionRegistry>(context_)),
      starts_(startServices()),
      purge_(context_,
             StorePurge::Recordings{[this] { return !sessions_->recordingSessions().empty(); },
                                    [this] {
                                      for (const Session& session : sessions_->recordingSessions()) {
                                        if (!session->recording()->writesMovies()) continue;
                                        session->recording()->fail(recordingError(errorcode::kInsufficientStorage));
                                      }
                                    },
                                    [this] {
                                      for (const Session& session : sessions_->recordingSessions()) {
                                        stopRecordingSession(session, [](QVRecording& recording) {
                                          QV_LOG(logs::kDaemon, "recording stopped without handler!");
                                          recording.finishAndCleanupSessionFiles(
                                              recordingError(errorcode::kInsufficientStorage));
                                        });
                                      }
                                    }}),
      alerts_(*platform_.globalQueue),
      requests_([this](const Caller& caller, platform::PeerStanding standing) { callerWasRefused(caller, standing); }),
      status_(sequence_, *context_, *sessions_, *foreground_, exemptions_, logQuotas_) {
  context_->files._srSetupTempDirectory();
  // What becomes of each is logged.
  (void)QVUnfinishedMovies(context_->files, *platform_.movieSalvage, *platform_.localization)
      ._srSalvageUnfinishedMovies();
  addRecordingRequests();
  addApplicationRequests();
  addBroadcastRequests();
  publicListener_ = platform_.ipc->createListener(kServiceName);
  publicListener_->setDelegate(this, sequence_);
  if (platform_.extensions) QVExtensionHostContext::registerWith(*platform_.extensions);
}

QVRecordingManager::~QVRecordingManager() = default;

StartServices QVRecordingManager::startServices() {
  return {sequence_,
          *context_,
          *sessions_,
          *foreground_,
          *broadcasts_,
          exemptions_,
          acknowledgements_,
          [this] { stopCurrentRecordingSessionWithHandler(); },
          [this](const Session& session) { interruptOtherRecordingSessionAgainstSession(session); },
          [this](const Session& session) { checkAndPlaySystemRecordSound(session, true); },
          [this](const Session& session) { recordingStarted(session); }};
}

std::optional<Error> QVRecordingManager::finishStartup() { return publicListener_->resume(); }

void QVRecordingManager::setLayoutMonitor(std::shared_ptr<platform::DisplayLayoutMonitor> monitor) {
  sequence_.sync([&] { layoutRule_->setLayoutMonitor(std::move(monitor)); });
}

void QVRecordingManager::shutDown(std::function<void()> handler) {
  sequence_.async([self = shared_from_this(), handler = std::move(handler)] {
    // The handler runs when the last finish has let go of this.
    const std::shared_ptr<void> whenAllFinished(nullptr, [handler](void*) { handler(); });
    for (const Session& session : self->sessions_->recordingSessions()) {
      session->recording()->end({.handler = [whenAllFinished](const auto&, const auto&) {}});
    }
  });
}

void QVRecordingManager::registerPurgeableSpace() {
  const auto answer = [weakSelf = weak_from_this()](const std::function<int64_t(StorePurge&)>& work) {
    const auto self = weakSelf.lock();
    return self ? self->sequence_.syncResult<int64_t>([&] { return work(self->purge_); }) : int64_t{0};
  };
  platform::PurgeableSpaceCallbacks callbacks;
  callbacks.purgeable = [answer](int32_t) { return answer([](StorePurge& purge) { return purge.purgeableSpace(); }); };
  callbacks.purge = [answer](int64_t, int32_t urgency) {
    return answer([urgency](StorePurge& purge) { return purge.purge(urgency); });
  };
  callbacks.cancel = [] {};
  callbacks.periodic = [answer](int64_t, int32_t) {
    return answer([](StorePurge& purge) { return purge.purgePeriodically(); });
  };
  platform_.purgeableSpace->registerCallbacks(kPurgeServiceName, std::move(callbacks));
}

}  // namespace qv
