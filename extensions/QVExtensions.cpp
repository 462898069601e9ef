#include "extensions/QVExtensions.h"

#include "platform/threads/Log.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::ExtensionRecord;
using platform::ExtensionRecordRef;
using platform::Value;
namespace extensioninfo = platform::extensioninfo;
namespace logs = platform::logs;

namespace {

bool declares(const Dictionary& rules, const std::string& rule) {
  const Value* value = platform::find(rules, rule);
  return value != nullptr && value->asBool();
}

bool matches(const ExtensionRecord& extension, const ExtensionQuery& query) {
  if (query.baseIdentifier && !extension.identifier.starts_with(*query.baseIdentifier)) return false;
  const Value* value = platform::find(extension.attributes, extensioninfo::kActivationRule);
  const auto* rules = value ? value->getIf<Dictionary>() : nullptr;
  if (rules == nullptr) return !query.activationRule;
  if (query.activationRule && !declares(*rules, *query.activationRule)) return false;
  return !query.unwantedActivationRule || !declares(*rules, *query.unwantedActivationRule);
}

}  // namespace

void extensionsWithMatchingPointName(platform::ExtensionService* service, ExtensionQuery query,
                                     ExtensionsCompletion completion) {
  if (service == nullptr) {
    if (completion) completion({}, Error::posix(ENOTSUP, "this device has no extensions"));
    return;
  }
  const Dictionary attributes{{extensioninfo::kPointIdentifier, Value(query.pointName)}};
  service->extensionsMatchingAttributes(
      attributes, [query = std::move(query), completion = std::move(completion)](
                      const std::vector<ExtensionRecordRef>& installed, const std::optional<Error>& error) {
        std::vector<ExtensionRecordRef> found;
        for (const ExtensionRecordRef& extension : installed) {
          QV_LOG_INFO(logs::kExtensions, "extension %s of %s", extension->identifier.c_str(),
                      extension->extensionPointIdentifier.c_str());
          if (matches(*extension, query)) found.push_back(extension);
        }
        if (completion) completion(found, error);
      });
}

BroadcastProcessMode processMode(const ExtensionRecord& extension) {
  const Value section = platform::valueForKey(extension.infoDictionary, extensioninfo::kSection);
  const std::string mode = platform::valueForKey(section.asDictionary(), broadcastpoint::kProcessMode).asString();
  return mode == broadcastpoint::kProcessModeSampleBuffer ? BroadcastProcessMode::Samples
                                                          : BroadcastProcessMode::MovieClips;
}

platform::ExtensionItem itemWithTitle(std::string title, Value attachment) {
  platform::ExtensionItem item;
  item.attributedTitle = std::move(title);
  item.attachments.push_back({platform::kGenericDataType, std::move(attachment)});
  return item;
}

}  // namespace qv
