#include "extensions/QVBroadcastProtocols.h"
#include "tests/daemon/RandomDriver.h"

namespace qv {

using platform::Value;

void RandomDriver::frame() {
  for (auto* controller : device_.screen.controllers) {
    if (controller->running) controller->sendAt(device_.clock.hostTime().value);
  }
}

void RandomDriver::sound() {
  const auto& tap = device_.tap.tap;
  if (tap && tap->running) {
    (void)device_.tap.fill(4410, static_cast<uint64_t>(device_.clock.hostTime().value), 4410);
  }
}

void RandomDriver::answerAlert() {
  std::vector<std::shared_ptr<fakes::FakeUserAlerts::Shown>> visible;
  for (const auto& alert : device_.alerts.shown) {
    if (alert->visible) visible.push_back(alert);
  }
  std::swap(device_.alerts.shown, visible);
  if (device_.alerts.shown.empty()) return;
  const auto chosen = device_.alerts.shown.begin() + static_cast<std::ptrdiff_t>(pick(device_.alerts.shown.size()));
  const auto alert = *chosen;
  device_.alerts.shown.erase(chosen);  // nobody answers twice
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

void RandomDriver::failCapture() {
  for (auto* controller : device_.screen.controllers) {
    const auto delegate = controller->delegate.lock();
    if (!controller->running || !delegate) continue;
    abandonWhatIsOpen();
    const size_t how = pick(3);
    if (how == 0) delegate->screenCaptureControllerWasPreempted(*controller);
    if (how == 1) delegate->screenCaptureControllerMediaServicesWereReset(*controller);
    if (how == 2) delegate->screenCaptureControllerDidFailWithStatus(*controller, -1);
    return;
  }
}

void RandomDriver::purgeDaily() {
  if (chance(30)) {
    trace("  two days later");
    device_.clock.advance(std::chrono::hours(48));
    model_.purged();
    wasPurged_ = true;
  }
  device_.purgeableSpace.callbacks.periodic(1, 1);
}

void RandomDriver::purgeUrgently() {
  model_.purged();
  wasPurged_ = true;
  const bool isNearlyFull = chance(50);
  if (isNearlyFull) device_.disk.setFreeSize(49'000'000);
  device_.purgeableSpace.callbacks.purge(1, isNearlyFull ? 2 : 3);
  device_.disk.setFreeSize(1'000'000'000);
}

void RandomDriver::changeFront() {
  const App app = pickApp();
  device_.applications.frontmost = actors_[app].bundleID;
  if (device_.applications.handler) {
    device_.applications.report(platform::kApplicationForeground, actors_[app].pid, chance(80));
  }
}

void RandomDriver::changeLibrary() {
  const bool refuses = chance(40);
  device_.photoLibrary.failure = refuses ? std::optional(platform::Error::posix(ENOSPC)) : std::nullopt;
}

void RandomDriver::changeExports() {
  device_.exports.holds = chance(50);
  device_.exports.result = chance(80) ? platform::ExportStatus::Completed : platform::ExportStatus::Failed;
}

void RandomDriver::endExports() {
  for (const auto& session : device_.exports.sessions) {
    if (session->whenEnded && chance(70)) session->end();
  }
}

/// The extension of the newest broadcast of samples goes on with its beginning: connects, then pings.
bool RandomDriver::connectExtension() {
  if (extensions_.empty()) return false;
  auto& extension = *extensions_.back();
  if (extension.connection || extension.vendor->callCount() == 0) return false;
  const auto call = extension.vendor->takeCall();
  const platform::ListenerEndpoint endpoint(*call.arguments.at(0).getIf<platform::SharedFileDescriptor>());
  call.reply({});
  auto connection = device_.ipc.connect(endpoint);
  if (!connection) return true;  // nobody waits for it any more
  extension.serve(std::move(*connection));
  extension.call("ping");
  return true;
}

void RandomDriver::moveExtension() {
  if (!connectExtension() && !extensions_.empty() && extensions_.back()->connection) {
    extensions_.back()->answers = chance(90);
    if (chance(30)) extensions_.back()->call("ping");
  }
}

void RandomDriver::killExtension() {
  if (!extensions_.empty() && extensions_.back()->connection) extensions_.back()->connection->invalidate();
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
