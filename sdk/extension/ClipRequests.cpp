#include "sdk/extension/ClipRequests.h"

#include <atomic>
#include <utility>

#include "platform/threads/Log.h"
#include "protocol/QVBroadcastProtocols.h"
#include "sdk/common/ValueCoding.h"

namespace quorvel {

ClipExtension::~ClipExtension() = default;

}  // namespace quorvel

namespace qv::extension {

using platform::ExtensionItem;
using platform::ExtensionRequestID;
using platform::Value;

namespace {

Value attachment(const std::vector<ExtensionItem>& items, std::string_view title) {
  for (const ExtensionItem& item : items) {
    if (item.attributedTitle == title && !item.attachments.empty()) return item.attachments.front().value;
  }
  return {};
}

ExtensionItem makeItem(const char* title, Value value) {
  return {title, {{platform::kGenericDataType, std::move(value)}}};
}

std::vector<ExtensionItem> itemsOfResult(const quorvel::ClipResult& result) {
  std::vector<ExtensionItem> items;
  if (result.configuration)
    items.push_back(makeItem(broadcastitem::kBroadcastConfiguration, Value(sdk::archive(*result.configuration))));
  if (result.serviceInfo)
    items.push_back(makeItem(broadcastitem::kServiceInfo, Value(sdk::toWire(*result.serviceInfo))));
  return items;
}

std::string fileName(const Value& location) {
  const auto* url = location.getIf<platform::URL>();
  const std::string path = (url ? *url : platform::URL(location.asString())).path();
  return path.substr(path.rfind('/') + 1);
}

quorvel::Clip makeClip(const std::vector<ExtensionItem>& items) {
  quorvel::Clip clip;
  clip.name = fileName(attachment(items, broadcastitem::kMovieClipURL));
  clip.isLast = attachment(items, broadcastitem::kRequestedFinish).asString() == "1";
  clip.userInfo = sdk::fromWire(attachment(items, broadcastitem::kUserInfo).asDictionary());
  return clip;
}

/// The one answer to a request.
class Answer {
 public:
  using Send = std::function<void(std::vector<ExtensionItem>)>;
  explicit Answer(Send send) : send_(std::move(send)) {}
  ~Answer() { give({}); }
  Answer(const Answer&) = delete;
  Answer& operator=(const Answer&) = delete;
  void give(const quorvel::ClipResult& result) {
    if (!given_.exchange(true)) send_(itemsOfResult(result));
  }

 private:
  const Send send_;
  std::atomic<bool> given_ = false;
};

}  // namespace

struct ClipRequests::Pending {
  ExtensionRequestID request = 0;
  quorvel::Clip clip;
  bool isAnswered = false;  // by the host: the file, or that there is none
};

ClipRequests::ClipRequests(std::shared_ptr<platform::SerialQueue> queue, Host host,
                           const quorvel::ClipExtensionFactory& make)
    : queue_(std::move(queue)), host_(std::move(host)), extension_(make()) {}

bool ClipRequests::isClip(const std::vector<ExtensionItem>& items) {
  return !attachment(items, broadcastitem::kSandboxToken).isNone();
}

void ClipRequests::begin(ExtensionRequestID request, const std::vector<ExtensionItem>& items) {
  auto pending = std::make_shared<Pending>(Pending{request, makeClip(items)});
  pending_.push_back(pending);
  host_.openFile(attachment(items, broadcastitem::kSandboxToken).asString(),
                 [weak = weak_from_this(), queue = queue_, pending](platform::SharedFileDescriptor file) {
                   queue->async(weak, [pending, file = std::move(file)](ClipRequests& self) {
                     pending->isAnswered = true;
                     if (file) pending->clip.file = file->get();
                     pending->clip.holder = file;
                     self.process();
                   });
                 });
}

/// Takes the clips at the front whose files have come.
void ClipRequests::process() {
  while (extension_ && !pending_.empty() && pending_.front()->isAnswered) {
    const std::shared_ptr<Pending> next = std::move(pending_.front());
    pending_.erase(pending_.begin());
    quorvel::ClipCompletion done = completionOf(next->request);
    if (next->clip.file < 0) {
      QV_LOG_ERROR(platform::logs::kExtensions, "clip %s cannot be read", next->clip.name.c_str());
      continue;
    }
    extension_->processClip(std::move(next->clip), std::move(done));
  }
}

quorvel::ClipCompletion ClipRequests::completionOf(ExtensionRequestID request) {
  auto answer = std::make_shared<Answer>([weak = weak_from_this(), request](std::vector<ExtensionItem> items) {
    if (const auto self = weak.lock()) self->host_.complete(request, std::move(items));
  });
  return [answer](const quorvel::ClipResult& result) { answer->give(result); };
}

void ClipRequests::close() {
  pending_.clear();
  extension_.reset();
}

}  // namespace qv::extension
