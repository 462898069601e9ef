#include "protocol/ExtensionRequests.h"

namespace qv {
using platform::Array;
using platform::Dictionary;
using platform::ExtensionItem;
using platform::IPCInterface;
using platform::ItemProvider;
using platform::Value;

namespace {

constexpr const char kTitle[] = "title";
constexpr const char kAttachments[] = "attachments";

}  // namespace

const IPCInterface& extensionRequestProtocol() {
  static const IPCInterface interface =
      CallList<extensioncall::BeginRequest>::interface("com.tarnwick.quorveld.QVExtensionRequestProtocol");
  return interface;
}

const IPCInterface& extensionRequestHostProtocol() {
  static const IPCInterface interface = CallList<extensioncall::CompleteRequest, extensioncall::OpenFile>::interface(
      "com.tarnwick.quorveld.QVExtensionRequestHostProtocol");
  return interface;
}

Value valueOfExtensionItems(const std::vector<ExtensionItem>& items) {
  Array values;
  for (const ExtensionItem& item : items) {
    Array attachments;
    for (const ItemProvider& provider : item.attachments) attachments.push_back(provider.value);
    values.emplace_back(
        Dictionary{{kTitle, Value(item.attributedTitle)}, {kAttachments, Value(std::move(attachments))}});
  }
  return Value(std::move(values));
}

std::vector<ExtensionItem> extensionItemsOfValue(const Value& value) {
  std::vector<ExtensionItem> items;
  const auto* values = value.getIf<Array>();
  if (values == nullptr) return items;
  for (const Value& each : *values) {
    const auto* dictionary = each.getIf<Dictionary>();
    if (dictionary == nullptr) continue;
    ExtensionItem& item = items.emplace_back();
    item.attributedTitle = platform::valueForKey(*dictionary, kTitle).asString("");
    const Value attachments = platform::valueForKey(*dictionary, kAttachments);
    const auto* list = attachments.getIf<Array>();
    if (list == nullptr) continue;
    for (const Value& attachment : *list) item.attachments.push_back({platform::kGenericDataType, attachment});
  }
  return items;
}

}  // namespace qv
