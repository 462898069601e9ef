#include "daemon/StartConditions.h"

#include "support/QVDiskSpace.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

Value met(const char* condition, std::string text) {
  return Dictionary{{"condition", condition}, {"met", true}, {"text", std::move(text)}};
}

/// The start goes on without it.
Value lacking(const char* condition, std::string text) {
  return Dictionary{{"condition", condition}, {"met", false}, {"text", std::move(text)}};
}

Value refused(const char* condition, int64_t code, std::string text) {
  return Dictionary{{"condition", condition}, {"met", false}, {"text", std::move(text)}, {"code", code}};
}

Value service(const char* condition, const platform::ServiceState& state, const char* instead) {
  if (state.fault) return lacking(condition, state.backend + ": " + state.fault->localizedDescription());
  return state.backend == "headless" ? lacking(condition, instead) : met(condition, state.backend);
}

}  // namespace

Array StartConditions::of(const status::GetStartConditions& request, const StatusView& view,
                          const platform::DeviceServices& services) const {
  uid_t user = view.user();
  // Whoever sees all asks for the one who runs it.
  const auto session = sessions_.find(request.bundleID);
  if (view.seesAll() && session) user = session->userIdentifier();
  Array conditions{bundle(request.bundleID), store(), space()};
  if (request.systemRecording) {
    conditions.push_back(entitlement(request.bundleID, user));
  } else {
    conditions.push_back(foreground(request.bundleID));
    conditions.push_back(consent(request.bundleID, user, request.microphoneEnabled));
  }
  conditions.push_back(service("display", services.display, "no display: a test picture is recorded"));
  conditions.push_back(service("sound", services.sound, "no sound server: a tone is recorded"));
  if (request.microphoneEnabled) conditions.push_back(microphone());
  if (services.movies.fault) {
    conditions.push_back(refused("encoder", errorcode::kFailedToSave, services.movies.fault->localizedDescription()));
  } else {
    conditions.push_back(met("encoder", services.movies.backend));
  }
  return conditions;
}

Value StartConditions::bundle(const std::string& bundleID) const {
  const auto found = context_.platform.bundles->bundleWithIdentifier(bundleID);
  return found ? met("bundle", found->path())
               : refused("bundle", errorcode::kFailedToStart, "no installed bundle has the identifier " + bundleID);
}

Value StartConditions::store() const {
  const auto unwritable = context_.files.prepareForMovies();
  if (!unwritable || isLackOfSpace(unwritable)) return met("store", context_.files._srTempPath());
  return refused("store", errorcode::kFailedToStart, unwritable->localizedDescription());
}

Value StartConditions::space() const {
  const uint64_t free = context_.space._srDeviceFreeDiskSpace();
  if (free == 0) return refused("space", errorcode::kInsufficientStorage, "none is free there, as far as can be told");
  std::string text = std::to_string(free / 1'000'000) + " MB free, more than " +
                     std::to_string(kMinimumFreeSpaceForRecording / 1'000'000) + " MB needed";
  if (free > kMinimumFreeSpaceForRecording) return met("space", std::move(text));
  return refused("space", errorcode::kInsufficientStorage, std::move(text));
}

Value StartConditions::entitlement(const std::string& bundleID, uid_t user) const {
  const Dictionary entitlements = context_.platform.entitlements->entitlementsForBundle(bundleID, user);
  const std::string name = kSystemClientEntitlement;
  if (platform::valueForKey(entitlements, name).asBool()) return met("entitlement", name);
  return refused("entitlement", errorcode::kEntitlements,
                 bundleID + " lacks " + name + " for user " + std::to_string(user));
}

Value StartConditions::foreground(const std::string& bundleID) const {
  if (foreground_.isApplicationInForegroundWithBundleIdentifier(bundleID)) return met("foreground", "in front");
  return refused("foreground", errorcode::kFailedToStart, bundleID + " is not in front");
}

Value StartConditions::consent(const std::string& bundleID, uid_t user, bool withMicrophone) const {
  if (exemptions_.isExemptFromAcknowledgementAlertSession(applicationOwner(bundleID, user), withMicrophone)) {
    return met("consent", "given a while ago");
  }
  return lacking("consent", "the user will be asked");
}

Value StartConditions::microphone() const {
  return context_.captureManager.hasAudioCaptureDevice() ? met("microphone", "there")
                                                         : lacking("microphone", "this device has no microphone");
}

}  // namespace qv
