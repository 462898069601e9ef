#include "platform/appstream/AppStreamStore.h"

#include <mutex>
#include <utility>

#include "platform/appstream/StoreModule.h"
#include "platform/threads/Log.h"

namespace qv::platform::appstream {

struct AppStreamStore::State {
  State(std::string root, Localization& texts, Executor& executorToUse, std::filesystem::path directory)
      : deviceRoot(std::move(root)),
        localization(texts),
        executor(executorToUse),
        modulePath(pathOfModule(directory, kStoreModule)) {}
  Result<StoreLookupResponse> lookUp(const StoreLookupRequest& request);

  const std::string deviceRoot;
  Localization& localization;
  Executor& executor;
  const std::filesystem::path modulePath;
  std::mutex mutex;  // one lookup at a time: each holds the whole catalogue
};

Result<StoreLookupResponse> AppStreamStore::State::lookUp(const StoreLookupRequest& request) {
  std::lock_guard lock(mutex);
  const auto entry = entryOfModule(modulePath, kStoreModuleEntry);
  if (!entry) return entry.error();
  const bool inUsersLanguage = request.localizationStyle == 1;
  const auto languages = inUsersLanguage ? localization.preferredLanguages() : std::vector<std::string>();
  Result<StoreLookupResponse> answer{StoreLookupResponse()};
  reinterpret_cast<LookUpInCatalogue>(entry.value())(deviceRoot, languages, request, answer);
  return answer;
}

AppStreamStore::AppStreamStore(std::string deviceRoot, Localization& localization, Executor& executor,
                               std::filesystem::path moduleDirectory)
    : state_(std::make_shared<State>(std::move(deviceRoot), localization, executor, std::move(moduleDirectory))) {}

void AppStreamStore::start(const StoreLookupRequest& request, Handler handler) {
  state_->executor.post([state = state_, request, handler = std::move(handler)] {
    const auto response = state->lookUp(request);
    if (response) return handler(response.value(), std::nullopt);
    QV_LOG_INFO(logs::kSupport, "store catalogue: %s", response.error().description().c_str());
    handler({}, response.error());
  });
}

}  // namespace qv::platform::appstream
