#include "daemon/StatusDesk.h"

#include <unistd.h>

#include <filesystem>
#include <utility>

#include "protocol/RecordingErrors.h"
#include "support/QVDiskSpace.h"

namespace qv {

using platform::Array;
using platform::Dictionary;
using platform::IPCReply;
using platform::Value;

namespace {

const char* stateName(QVRecording::State state) {
  if (state == QVRecording::State::Paused) return "paused";
  return state == QVRecording::State::Preparing ? "preparing" : "running";
}

Dictionary describe(QVRecordingSession& session, bool isOwn) {
  const QVRecording& recording = *session.recording();
  const RecordingSettings& settings = recording.settings();
  const RecordingFigures figures = recording.figures();
  Dictionary all{{"kind", settings.broadcast        ? "broadcast"
                          : settings.captureEnabled ? "capture"
                                                    : "movie"},
                 {"systemRecording", settings.systemRecording},
                 {"state", stateName(recording.state())}};
  if (figures.since) all["since"] = figures.since->secondsSince1970;
  if (!isOwn) return all;
  all["bundleIdentifier"] = session.bundleID();
  all["userIdentifier"] = uint32_t{session.userIdentifier()};
  all["seconds"] = figures.recorded.seconds();
  all["pictures"] = figures.pictures;
  all["microphoneEnabled"] = recording.microphoneEnabled();
  if (figures.output.droppedPictures) all["droppedPictures"] = *figures.output.droppedPictures;
  if (!figures.output.videoEncoder.empty()) all["videoEncoder"] = figures.output.videoEncoder;
  if (!settings.broadcast && !settings.captureEnabled) all["bytes"] = figures.bytes;
  return all;
}

const char* standingName(MovieStanding::Hands hands) {
  switch (hands) {
    case MovieStanding::Hands::Recorded:
      return "recording";
    case MovieStanding::Hands::Handed:
      return "waiting";
    case MovieStanding::Hands::Saved:
      return "saving";
    case MovieStanding::Hands::Removed:
      return "removing";
  }
  return "nobody";
}

void describeStanding(Dictionary& movie, const MovieStanding& standing) {
  movie["state"] = standingName(standing.hands);
  const size_t end = standing.owner.rfind(':');
  if (end == std::string::npos) return;
  movie["bundleIdentifier"] = standing.owner.substr(0, end);
  movie["userIdentifier"] = static_cast<uint32_t>(std::stoul(standing.owner.substr(end + 1)));
}

Dictionary describe(const platform::ServiceState& state) {
  Dictionary all{{"backend", state.backend}};
  if (state.fault) all["fault"] = state.fault->localizedDescription();
  return all;
}

}  // namespace

StatusDesk::StatusDesk(platform::SerialQueue& sequence, RecordingContext& context, SessionRegistry& sessions,
                       ForegroundFollower& foreground, const QVExemptionBook& exemptions,
                       platform::LogQuotas& logQuotas)
    : context_(context),
      sessions_(sessions),
      conditions_(context, sessions, foreground, exemptions),
      logQuotas_(logQuotas),
      services_(std::make_shared<ServicesLook>(context.platform, sequence)) {}

void StatusDesk::handleCall(const std::shared_ptr<platform::IPCConnection>& connection,
                            const platform::IPCOperation& operation, platform::IPCArguments arguments, IPCReply reply) {
  const Caller caller{connection};
  const platform::LogQuotas::Scope lines(logQuotas_, caller.user());
  status::All::dispatch(operation.member, arguments, [&](const auto& request) { serve(caller, request, reply); });
}

void StatusDesk::serve(const Caller& caller, const status::GetRecordings&, const IPCReply& reply) const {
  const StatusView view(caller);
  Array recordings;
  for (const auto& session : sessions_.recordingSessions()) {
    recordings.emplace_back(describe(*session, view.sees(session->userIdentifier())));
  }
  reply({std::move(recordings)});
}

void StatusDesk::serve(const Caller& caller, const status::GetStartConditions& request, const IPCReply& reply) const {
  services_->look([this, view = StatusView(caller), request, reply](const platform::DeviceServices& services) {
    const platform::LogQuotas::Scope lines(logQuotas_, view.user());
    reply({conditions_.of(request, view, services)});
  });
}

void StatusDesk::serve(const Caller& caller, const status::GetMovies&, const IPCReply& reply) const {
  const StatusView view(caller);
  const auto names = context_.files.disk().contentsOfDirectory(context_.files._srTempPath());
  const auto standings = context_.movies->standings();
  Array movies;
  for (const std::string& name : names ? names.value() : std::vector<std::string>{}) {
    const std::string path = context_.files.pathInStore(name);
    const auto attributes = context_.files.disk().attributesOfItem(path);
    const auto standing = standings.find(std::filesystem::path(path).lexically_normal().string());
    const bool isNobodys = standing == standings.end();
    if (!attributes || !view.seesOwner(isNobodys ? std::string() : standing->second.owner)) continue;
    Dictionary movie{{"name", name},
                     {"movieURL", platform::URL::fileURL(path).absoluteString()},
                     {"bytes", attributes.value().size},
                     {"modified", attributes.value().modificationDate.secondsSince1970},
                     {"state", "nobody"}};
    if (!isNobodys) describeStanding(movie, standing->second);
    movies.emplace_back(std::move(movie));
  }
  reply({std::move(movies)});
}

void StatusDesk::serve(const Caller& caller, const status::GetDevice&, const IPCReply& reply) const {
  services_->look([this, user = caller.user(), reply](const platform::DeviceServices& services) {
    const platform::LogQuotas::Scope lines(logQuotas_, user);
    reply({device(services)});
  });
}

Dictionary StatusDesk::device(const platform::DeviceServices& services) const {
  const std::string key = localizationKeyForErrorCode(errorcode::kUserDeclined);
  return {{"version", QV_VERSION},
          {"userIdentifier", uint32_t{::geteuid()}},
          {"display", describe(services.display)},
          {"sound", describe(services.sound)},
          {"encoder", describe(services.movies)},
          {"hasMicrophone", context_.captureManager.hasAudioCaptureDevice()},
          {"space", conditions_.space()},
          {"freeBytes", context_.space._srDeviceFreeDiskSpace()},
          {"store", conditions_.store()},
          {"hasTexts", context_.texts.localizedText(key) != key}};
}

}  // namespace qv
