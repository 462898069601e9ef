#include "protocol/Calls.h"

namespace qv {

void describeReply(platform::IPCOperation& operation, std::string_view list) {
  operation.reply.emplace();
  while (!list.empty()) {
    const std::string_view value = list.substr(0, list.find(", "));
    const size_t space = value.find(' ');
    operation.reply->emplace_back(value.substr(0, space));
    operation.replyNames.emplace_back(value.substr(space + 1));
    list.remove_prefix(std::min(value.size() + 2, list.size()));
  }
}

}  // namespace qv
