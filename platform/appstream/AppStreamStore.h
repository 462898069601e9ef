#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "platform/Bundles.h"
#include "platform/Localization.h"
#include "platform/StoreLookup.h"
#include "platform/threads/Executor.h"

namespace qv::platform::appstream {

/// The AppStream catalogue of the device, in swcatalog/xml and swcatalog/yaml below usr/share, var/lib and
/// var/cache of the device root. A component belongs to the bundle whose identifier is its id, with or
/// without ".desktop" at its end.
///
/// The link to an item is "appstream:" and its id, which store applications open. The name and the developer
/// come in the user's language where the catalogue has them; categories are the registered names, as they
/// stand. The catalogue is read anew at each lookup and let go of afterwards.
///
/// `quorveld-store.so`, with the libraries that this takes, is loaded at the first lookup. Where it is missing
/// lookups end in an error.
///
/// Threading: thread-safe. Lookups run on the executor, one after the other.
class AppStreamStore final : public StoreLookupService {
 public:
  /// `moduleDirectory`: empty for the places of pathOfModule. `localization` must outlive the executor's work.
  AppStreamStore(std::string deviceRoot, Localization& localization, Executor& executor,
                 std::filesystem::path moduleDirectory = {});
  void start(const StoreLookupRequest& request, Handler handler) override;

 private:
  struct State;
  const std::shared_ptr<State> state_;
};

}  // namespace qv::platform::appstream
