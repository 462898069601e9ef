#include "protocol/QVBroadcastProtocols.h"
#include "tests/daemon/RandomDriver.h"

namespace qv {

const std::vector<RandomDriver::Step>& RandomDriver::deviceSteps() {
  using D = RandomDriver;
  static const std::vector<Step> all{
      {24, "frame",
       [](D& d) {
         for (auto* controller : d.device_.screen.controllers) {
           if (controller->running) controller->sendAt(d.device_.clock.hostTime().value);
         }
       }},
      {4, "sound",
       [](D& d) {
         const auto& tap = d.device_.tap.tap;
         if (tap && tap->running) (void)d.device_.tap.fill(4410, d.device_.clock.hostTime().value);
       }},
      {10, "answerAlert", [](D& d) { d.answerAlert(); }},
      {2, "failCapture",
       [](D& d) {
         for (auto* controller : d.device_.screen.controllers) {
           const auto delegate = controller->delegate.lock();
           if (!controller->running || !delegate) continue;
           d.abandonWhatIsOpen();
           const size_t how = d.pick(3);
           if (how == 0) delegate->screenCaptureControllerWasPreempted(*controller);
           if (how == 1) delegate->screenCaptureControllerMediaServicesWereReset(*controller);
           if (how == 2) delegate->screenCaptureControllerDidFailWithStatus(*controller, -1);
           return;
         }
       }},
      {1, "purgeDaily",
       [](D& d) {
         if (d.chance(30)) {
           d.trace("  two days later");
           d.device_.clock.advance(std::chrono::hours(48));
           d.model_.purged();
           d.wasPurged_ = true;
         }
         d.device_.purgeableSpace.callbacks.periodic(1, 1);
       }},
      {1, "purgeUrgently",
       [](D& d) {
         d.model_.purged();
         d.wasPurged_ = true;
         const bool isNearlyFull = d.chance(50);
         if (isNearlyFull) d.device_.disk.setFreeSize(49'000'000);
         d.device_.purgeableSpace.callbacks.purge(1, isNearlyFull ? 2 : 3);
         d.device_.disk.setFreeSize(1'000'000'000);
       }},
      {1, "changeFront",
       [](D& d) {
         const App app = d.pickApp();
         d.device_.applications.frontmost = d.actors_[app].bundleID;
         if (d.device_.applications.handler) {
           d.device_.applications.report(platform::kApplicationForeground, d.actors_[app].pid, d.chance(80));
         }
       }},
      {2, "changeLibrary",
       [](D& d) {
         const bool refuses = d.chance(40);
         d.device_.photoLibrary.failure = refuses ? std::optional(platform::Error::posix(ENOSPC)) : std::nullopt;
       }},
      {2, "changeExports",
       [](D& d) {
         d.device_.exports.holds = d.chance(50);
         d.device_.exports.result = d.chance(80) ? platform::ExportStatus::Completed : platform::ExportStatus::Failed;
       }},
      {5, "endExports",
       [](D& d) {
         for (const auto& session : d.device_.exports.sessions) {
           if (session->whenEnded && d.chance(70)) session->end();
         }
       }},
      {8, "moveExtension",
       [](D& d) {
         if (!d.connectExtension() && !d.extensions_.empty() && d.extensions_.back()->connection) {
           d.extensions_.back()->answers = d.chance(90);
           if (d.chance(30)) d.extensions_.back()->call("ping");
         }
       }},
      {1, "killExtension",
       [](D& d) {
         if (!d.extensions_.empty() && d.extensions_.back()->connection) d.extensions_.back()->connection->invalidate();
       }},
      {3, "answerClip", [](D& d) { d.answerClip(); }}};
  return all;
}

void RandomDriver::answerAlert() {
  auto& shown = device_.alerts.shown;
  std::erase_if(shown, [](const auto& alert) { return !alert->visible; });
  if (shown.empty()) return;
  const auto chosen = shown.begin() + static_cast<std::ptrdiff_t>(pick(shown.size()));
  const auto alert = *chosen;
  shown.erase(chosen);  // nobody answers twice
  using platform::UserAlertAnswer;
  const UserAlertAnswer answers[] = {UserAlertAnswer::Default,   UserAlertAnswer::Default, UserAlertAnswer::Alternate,
                                     UserAlertAnswer::Alternate, UserAlertAnswer::Other,   UserAlertAnswer::Cancelled};
  alert->handler(answers[pick(std::size(answers))]);
}

/// What a recording that is open now leaves may be told to nobody.
void RandomDriver::abandonWhatIsOpen() {
  const auto& movies = device_.movies.movies;
  for (size_t i = movies.size() > 8 ? movies.size() - 8 : 0; i < movies.size(); ++i) {
    abandoned_.insert(movies[i]->content);
  }
}

/// The extension of the newest broadcast of samples goes on with its beginning: connects, then pings.
bool RandomDriver::connectExtension() {
  if (extensions_.empty()) return false;
  auto& extension = *extensions_.back();
  if (extension.connection || extension.vendor->callCount() == 0) return false;
  if (extension.connect()) extension.call("ping");
  return true;
}

/// Any of the requests of extensions that are not answered yet, one after the other.
void RandomDriver::answerClip() {
  if (answeredClips_ == device_.extensions.requests.size()) return;
  if (chance(90)) {
    device_.extensions.complete(answeredClips_++, std::vector<platform::ExtensionItem>{});
  } else {
    device_.extensions.complete(answeredClips_++, platform::Error{"extension", 1, {}});
  }
}

}  // namespace qv
