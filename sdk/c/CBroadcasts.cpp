#include <utility>

#include "sdk/c/CError.h"
#include "sdk/c/CRecorder.h"
#include "sdk/c/CValue.h"

using namespace qv::c;

namespace {

quorvel::Value::Array described(const std::vector<quorvel::BroadcastExtension>& extensions) {
  quorvel::Value::Array entries;
  for (const auto& extension : extensions) {
    auto& entry = entries.emplace_back().content.emplace<quorvel::Dictionary>();
    entry["bundleID"] = {extension.bundleID};
    if (!extension.displayName.empty()) entry["displayName"] = {extension.displayName};
    if (!extension.icon.empty()) entry["icon"] = {extension.icon};
  }
  return entries;
}

}  // namespace

void quorvel_recorder_setup_broadcast(quorvel_recorder* recorder, const quorvel_broadcast_options* options,
                                      quorvel_error_handler handler, void* context) {
  const auto given = read(options, quorvel_broadcast_options QUORVEL_BROADCAST_OPTIONS_INIT);
  quorvel::BroadcastOptions made;
  made.hostBundleID = text(given.host_bundle_id);
  made.extensionBundleID = text(given.extension_bundle_id);
  made.configuration =
      quorvel::archivedConfiguration({given.clip_duration, dictionaryOf(given.video_compression_properties)});
  made.userInfo = dictionaryOf(given.user_info);
  recorder->recorder->setupBroadcast(std::move(made), completionHandler(handler, context));
}

void quorvel_recorder_current_broadcast_images(quorvel_recorder* recorder, quorvel_broadcast_images_handler handler,
                                               void* context) {
  recorder->recorder->currentBroadcastImages([=](const quorvel::BroadcastImagesResult& result) {
    if (!handler) return;
    handler(context, errorFor(result.error).get(), result.hostApp.data(), result.hostApp.size(),
            result.extension.data(), result.extension.size());
  });
}

void quorvel_recorder_system_broadcast_extensions(quorvel_recorder* recorder, quorvel_value_handler handler,
                                                  void* context) {
  recorder->recorder->systemBroadcastExtensions([=](const quorvel::BroadcastExtensionsResult& result) {
    const auto list = result.error ? nullptr : valueFor(quorvel::Value{described(result.extensions)});
    if (handler) handler(context, errorFor(result.error).get(), list.get());
  });
}

void quorvel_recorder_set_broadcast_url(quorvel_recorder* recorder, const char* url, quorvel_error_handler on_failure,
                                        void* context) {
  recorder->recorder->setBroadcastURL(text(url), failureHandler(on_failure, context));
}
