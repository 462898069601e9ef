#include <algorithm>
#include <cerrno>
#include <utility>

#include "platform/linux/LinuxExtensionProcess.h"
#include "protocol/ExtensionRequests.h"

namespace qv::platform {
namespace {

constexpr size_t kMaximumReturnedItems = 64;
constexpr size_t kMaximumReturnedBytes = 1 << 20;  // of all items of one request together

/// Roughly what it takes in memory, with its containers; messages nest no deeper than the wire format allows.
size_t bytesOf(const Value& value) {
  size_t bytes = sizeof(Value);
  if (const auto* text = value.getIf<std::string>()) bytes += text->size();
  if (const auto* data = value.getIf<Data>()) bytes += data->size();
  for (const Value& each : value.asArray()) bytes += bytesOf(each);
  for (const auto& [key, each] : value.asDictionary()) bytes += key.size() + bytesOf(each);
  return bytes;
}

bool isWithinBounds(const Value& items) {
  const Array& all = items.asArray();
  return all.size() <= kMaximumReturnedItems &&
         std::all_of(all.begin(), all.end(),
                     [](const Value& item) {
                       return valueForKey(item.asDictionary(), "attachments").asArray().size() <= kMaximumReturnedItems;
                     }) &&
         bytesOf(items) <= kMaximumReturnedBytes;
}

}  // namespace

void LinuxExtensionProcess::completeRequest(ExtensionRequestID request, const Value& items) {
  const auto it = requests_.find(request);
  if (it == requests_.end() || it->second.stage == Stage::Waiting || it->second.outcome) {
    return logOddity("it completes request " + std::to_string(request) + ", which it does not have");
  }
  Outcome outcome = isWithinBounds(items) ? Outcome(extensionItemsOfValue(items))
                                          : Outcome(Error::posix(EMSGSIZE, "extension " + extension_->identifier));
  if (it->second.stage == Stage::Begun) return end(request, std::move(outcome));
  it->second.outcome = std::move(outcome);
}

void LinuxExtensionProcess::end(ExtensionRequestID request, Outcome outcome) {
  auto entry = requests_.extract(request);
  if (entry.empty()) return;
  tokens_->endRequest(request);
  auto& handlers = entry.mapped().handlers;
  if (entry.mapped().stage != Stage::Begun) {
    if (!handlers.began) return;
    return handlerQueue_.async(
        [began = std::move(handlers.began), request, error = outcome.error()] { began(request, error); });
  }
  // Until its owner knows that it is over, what the request went to can be asked.
  handlerQueue_.async([host = host_, completed = std::move(handlers.completed), request, outcome = std::move(outcome)] {
    if (completed) completed(request, outcome);
    host->places.with([&](auto& places) { places.erase(request); });
  });
}

}  // namespace qv::platform
