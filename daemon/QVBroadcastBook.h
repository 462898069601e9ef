#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "extensions/QVExtensions.h"
#include "platform/Extensions.h"
#include "platform/threads/SerialQueue.h"
#include "session/QVRecording.h"

namespace qv {

/// The broadcasts that were set up, and what is shown of the current one. Memory only.
///
/// Threading: the manager's sequence only. Handlers run there.
class QVBroadcastBook : public std::enable_shared_from_this<QVBroadcastBook> {
 public:
  struct SetupRequest {
    std::string hostBundleID;
    std::string hostOwner;  ///< as in applicationOwner
    std::string extensionBundleID;
    platform::Data configuration;
    platform::Dictionary userInfo;
    /// What the host records at the moment, if anything: the set-up is for what comes after it, and survives its end.
    std::weak_ptr<const QVRecording> before;
  };
  using SetupHandler = std::function<void(const std::optional<platform::Error>&)>;
  using InfoHandler = std::function<void(platform::Array, const std::optional<platform::Error>&)>;

  QVBroadcastBook(platform::SerialQueue& sequence, std::shared_ptr<RecordingContext> context)
      : sequence_(sequence), context_(std::move(context)) {}

  /// Finds the upload extension with the same base identifier and notes it, in place of any earlier one of that host.
  /// RECORDING_ERROR_INVALID_BROADCAST_SESSION, and nothing noted, where there is none or the configuration is none.
  void setupBroadcast(SetupRequest request, SetupHandler handler);
  [[nodiscard]] const QVBroadcastInfo* infoForHostBundleID(const std::string& hostOwner) const;
  /// A recording of this host that had begun has ended: a set-up is for one recording.
  void recordingEnded(const std::shared_ptr<const QVRecording>& recording);
  /// One dictionary for each installed upload extension: "displayName", "extBundleID", "extAppImgData" (PNG). An
  /// extension without name or icon lacks that key.
  void getSystemBroadcastExtensionInfo(InfoHandler handler);

  /// Of the broadcast that was set up last; PNG images, empty without.
  [[nodiscard]] const platform::Data& currentHostAppImage() const { return currentHostAppImage_; }
  [[nodiscard]] const platform::Data& currentExtensionAppImage() const { return currentExtensionAppImage_; }
  /// Offered, not called by this daemon.
  [[nodiscard]] const std::string& currentExtensionDisplayName() const { return currentExtensionDisplayName_; }
  void clearPresentation();

 private:
  using LoadHandler = std::function<void(const platform::ExtensionRecordRef&)>;
  void loadBroadcastUploadExtensionWithBaseIdentifier(const std::string& base, LoadHandler handler);
  void store(const SetupRequest& request, const platform::ExtensionRecordRef& extension,
             const QVBroadcastConfiguration& configuration);

  platform::SerialQueue& sequence_;
  const std::shared_ptr<RecordingContext> context_;
  struct Entry {
    QVBroadcastInfo info;
    std::weak_ptr<const QVRecording> before;
  };
  std::map<std::string, Entry> hostBundleIDtoExtensionInfoLookup_;  ///< by the host's owner
  platform::Data currentHostAppImage_;
  platform::Data currentExtensionAppImage_;
  std::string currentExtensionDisplayName_;
};

}  // namespace qv
