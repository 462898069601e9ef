#include "daemon/QVBroadcastBook.h"

#include <utility>

#include "platform/threads/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Array;
using platform::Data;
using platform::Dictionary;
using platform::Error;
using platform::ExtensionRecordRef;
using platform::Value;
namespace logs = platform::logs;

void QVBroadcastBook::setupBroadcast(SetupRequest request, SetupHandler handler) {
  auto configuration = QVBroadcastConfiguration::decodeReceived(request.configuration);
  if (!configuration) {
    QV_LOG_ERROR(logs::kDaemon, "no broadcast configuration: %s", configuration.error().description().c_str());
    handler(recordingError(errorcode::kInvalidBroadcastSession));
    return;
  }
  const std::string base = QVBundleTexts::baseIdentifier(request.extensionBundleID);
  if (base.empty()) {
    QV_LOG_ERROR(logs::kDaemon, "\"%s\" names no broadcast extension", request.extensionBundleID.c_str());
    handler(recordingError(errorcode::kInvalidBroadcastSession));
    return;
  }
  loadBroadcastUploadExtensionWithBaseIdentifier(
      base, [self = shared_from_this(), request = std::move(request), configuration = *configuration,
             handler = std::move(handler)](const ExtensionRecordRef& extension) {
        if (!extension) {
          QV_LOG_ERROR(logs::kDaemon, "no upload extension belongs to %s", request.extensionBundleID.c_str());
          handler(recordingError(errorcode::kInvalidBroadcastSession));
          return;
        }
        self->store(request, extension, configuration);
        handler(std::nullopt);
      });
}

void QVBroadcastBook::loadBroadcastUploadExtensionWithBaseIdentifier(const std::string& base, LoadHandler handler) {
  QV_LOG(logs::kDaemon, "looking for upload extension");
  const auto answer = [self = shared_from_this(), handler = std::move(handler)](const ExtensionRecordRef& extension) {
    self->sequence_.async([handler, extension] { handler(extension); });
  };
  platform::ExtensionService* const service = context_->platform.extensions;
  extensionsWithMatchingPointName(service, {.pointName = broadcastpoint::kUpload, .baseIdentifier = base},
                                  [service, base, answer](const auto& uploads, const auto& uploadError) {
                                    if (!uploadError && !uploads.empty()) {
                                      answer(uploads.front());
                                      return;
                                    }
                                    extensionsWithMatchingPointName(
                                        service,
                                        {.pointName = broadcastpoint::kGeneral,
                                         .baseIdentifier = base,
                                         .unwantedActivationRule = platform::extensioninfo::kSupportsStreaming},
                                        [answer](const auto& others, const auto& error) {
                                          answer(error || others.empty() ? nullptr : others.front());
                                        });
                                  });
}

void QVBroadcastBook::store(const SetupRequest& request, const ExtensionRecordRef& extension,
                            const QVBroadcastConfiguration& configuration) {
  hostBundleIDtoExtensionInfoLookup_[request.hostOwner] = {
      {extension, processMode(*extension), request.userInfo, configuration}, request.before};
  currentExtensionAppImage_ = extension->icons.empty() ? Data() : extension->icons.front();
  currentExtensionDisplayName_ = extension->displayName;
  currentHostAppImage_ = context_->texts._qvAppIconFromBundleID(request.hostBundleID);
}

const QVBroadcastInfo* QVBroadcastBook::infoForHostBundleID(const std::string& hostOwner) const {
  const auto info = hostBundleIDtoExtensionInfoLookup_.find(hostOwner);
  return info == hostBundleIDtoExtensionInfoLookup_.end() ? nullptr : &info->second.info;
}

void QVBroadcastBook::recordingEnded(const std::shared_ptr<const QVRecording>& recording) {
  const auto entry = hostBundleIDtoExtensionInfoLookup_.find(recording->settings().owner);
  if (entry == hostBundleIDtoExtensionInfoLookup_.end() || entry->second.before.lock() == recording) return;
  hostBundleIDtoExtensionInfoLookup_.erase(entry);
}

void QVBroadcastBook::getSystemBroadcastExtensionInfo(InfoHandler handler) {
  extensionsWithMatchingPointName(
      context_->platform.extensions, {.pointName = broadcastpoint::kUpload},
      [self = shared_from_this(), handler = std::move(handler)](const auto& extensions, const auto& error) {
        Array list;
        for (const ExtensionRecordRef& extension : extensions) {
          if (error) break;
          Dictionary info{{"extBundleID", Value(extension->identifier)}};
          if (!extension->displayName.empty()) info.emplace("displayName", Value(extension->displayName));
          if (!extension->icons.empty()) info.emplace("extAppImgData", Value(extension->icons.front()));
          list.emplace_back(std::move(info));
        }
        self->sequence_.async([handler, list, error] { handler(list, error); });
      });
}

void QVBroadcastBook::clearPresentation() {
  currentHostAppImage_.clear();
  currentExtensionAppImage_.clear();
  currentExtensionDisplayName_.clear();
}

}  // namespace qv
