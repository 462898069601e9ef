#pragma once

#include <functional>
#include <string>

#include "platform/StoreLookup.h"
#include "platform/threads/SerialQueue.h"
#include "support/QVBundleTexts.h"
#include "support/QVStoreInfo.h"

namespace qv {

/// Looks applications up in the device's store catalogue. Offered, not called by this daemon.
///
/// Threading: thread-safe.
class QVStoreManager {
 public:
  /// One for the process. What it is given is borrowed, and must outlive the lookups.
  QVStoreManager(platform::StoreLookupService& storeLookup, platform::SerialQueue& mainQueue,
                 const QVBundleTexts& texts)
      : storeLookup_(storeLookup), mainQueue_(mainQueue), texts_(texts) {}

  /// Asks the catalogue and returns. The completion is called once, on the main queue, and always gets a
  /// record: what the catalogue does not know is empty, the name is that of the installed application
  /// then (absent where there is none), and the categories are absent.
  void loadItemDetailsForBundleIdentifier(const std::string& bundleIdentifier,
                                          std::function<void(const QVStoreInfo&)> completionHandler);

 private:
  platform::StoreLookupService& storeLookup_;
  platform::SerialQueue& mainQueue_;
  const QVBundleTexts& texts_;
};

}  // namespace qv
