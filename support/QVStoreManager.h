#pragma once

#include <functional>
#include <string>

#include "support/QVStoreInfo.h"

namespace qv {

/// Looks applications up in the device's store catalogue.
///
/// Threading: thread-safe.
class QVStoreManager {
 public:
  /// The one of the process, made at its first use.
  static QVStoreManager& sharedManager();

  /// Asks the catalogue and returns. The completion is called once, on the main queue, and always gets a
  /// record: what the catalogue does not know is empty, the name is that of the installed application
  /// then (absent where there is none), and the categories are absent.
  void loadItemDetailsForBundleIdentifier(const std::string& bundleIdentifier,
                                          std::function<void(const QVStoreInfo&)> completionHandler);

 private:
  QVStoreManager() = default;
};

}  // namespace qv
