#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Error.h"
#include "platform/Value.h"

namespace qv::platform {

/// Preferences, one JSON file per domain, read at each use.
///
/// Threading: thread-safe, blocking.
class PreferenceStore {
 public:
  virtual ~PreferenceStore() = default;
  /// None where the key, the file, or a readable file is missing.
  [[nodiscard]] virtual Value valueForKey(const std::string& domain, const std::string& key) = 0;
};

enum class UserInterfaceIdiom : int32_t { Unspecified = -1, Phone = 0, Tablet = 1, Television = 2 };

/// What the hardware is. Answers come from the device description, one JSON file under the device
/// root; without it the device is a plain television box without microphone.
///
/// Threading: thread-safe.
class DeviceInfoQuery {
 public:
  virtual ~DeviceInfoQuery() = default;
  [[nodiscard]] virtual UserInterfaceIdiom userInterfaceIdiom() = 0;
  /// Properties by name, e.g. "ChipID"; 0 or false where the description lacks them.
  [[nodiscard]] virtual int64_t integerProperty(std::string_view name) = 0;
  [[nodiscard]] virtual bool booleanProperty(std::string_view name) = 0;
  [[nodiscard]] virtual bool hasAudioCaptureDevice() = 0;
  /// Whether internal security policies are allowed for a program (internal builds only).
  [[nodiscard]] virtual bool allowsInternalSecurityPolicies(std::string_view program) = 0;
};

/// Asks this process to give up disk space, urgently from 1 to 3: at 1 what is of no use to anybody goes, at 2 whoever
/// fills the disk stops and keeps what is made (movie recordings end and keep their movies), at 3 all goes that can.
/// Callbacks return a byte amount and may come on any thread.
struct PurgeableSpaceCallbacks {
  std::function<int64_t(int32_t urgency)> purgeable;
  std::function<int64_t(int64_t amount, int32_t urgency)> purge;
  std::function<void()> cancel;
  std::function<int64_t(int64_t amount, int32_t urgency)> periodic;
};

class PurgeableSpaceService {
 public:
  virtual ~PurgeableSpaceService() = default;
  virtual void registerCallbacks(const std::string& serviceName, PurgeableSpaceCallbacks callbacks) = 0;
};

enum class PhotoResourceType : int32_t { Video = 2 };

/// The user's library of photos and movies.
///
/// Threading: thread-safe. The completion comes on a thread of the library's.
class PhotoLibrary {
 public:
  virtual ~PhotoLibrary() = default;
  /// Adds a copy of the file; half a file never appears. No error on success.
  virtual void createAsset(const URL& file, PhotoResourceType type,
                           std::function<void(const std::optional<Error>&)> completion) = 0;
};

/// One usage-metrics message.
struct MetricsMessage {
  int32_t clientType = 0;
  int32_t clientVersion = 0;
  int64_t sessionID = 0;
  bool batchEvent = false;
  bool userInfoRequired = false;
  std::string clientName;
  std::string serviceName;
  uint16_t category = 0;
  uint16_t type = 0;
  Dictionary payload;
};

/// Threading: thread-safe.
class MetricsReporter {
 public:
  virtual ~MetricsReporter() = default;
  /// No error on success.
  virtual std::optional<Error> sendMessage(const MetricsMessage& message) = 0;
};

/// One element of what the display shows.
struct DisplayLayoutElement {
  std::string identifier;
  int64_t level = 0;  ///< 0: an ordinary application; 2 and above: over applications
};
struct DisplayLayout {
  std::vector<DisplayLayoutElement> elements;
};

class DisplayLayoutMonitor;
class DisplayLayoutObserver {
 public:
  virtual ~DisplayLayoutObserver() = default;
  /// Called on the monitor's own thread.
  virtual void layoutMonitorDidUpdateDisplayLayout(DisplayLayoutMonitor& monitor, const DisplayLayout& layout) = 0;
};

/// Threading: thread-safe.
class DisplayLayoutMonitor {
 public:
  virtual ~DisplayLayoutMonitor() = default;
  virtual void addObserver(std::weak_ptr<DisplayLayoutObserver> observer) = 0;
  virtual void removeObserver(const DisplayLayoutObserver* observer) = 0;
  virtual void invalidate() = 0;
};

}  // namespace qv::platform
