#include "session/ClipHandover.h"

#include <utility>

#include "extensions/QVExtensions.h"
#include "platform/threads/Log.h"
#include "protocol/QVBroadcastProtocols.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::ExtensionItem;
using platform::ExtensionRequestID;
using platform::Result;
using platform::URL;
using platform::Value;
namespace logs = platform::logs;

namespace {
constexpr const char kReadTokenClass[] = "com.tarnwick.quorveld.read-only";

void removeClip(MovieClaim& clip) {
  clip.remove([](const std::optional<Error>&) { QV_LOG(logs::kSession, "extension finished, clean up movie clip"); });
}
}  // namespace

ClipHandover::ClipHandover(const platform::Platform& platform, const platform::ExtensionRecordRef& extension,
                           Dictionary userInfo, ClipHandoverEvents events)

    : platform_(platform),
      userInfo_(std::move(userInfo)),
      events_(std::move(events)),
      use_(platform.extensions->useExtension(extension)) {}

/// Files are finished by several writers at once, so a later clip may be complete before an earlier one.
void ClipHandover::clipCompleted(int64_t number, ClipFile clip, bool finished, std::function<void()> handed) {
  {
    std::lock_guard lock(mutex_);
    completed_[number] = {std::move(clip), finished, std::move(handed)};
  }
  while (const auto ready = takeNext()) {
    if (ready->clip) _notifyBroadcastExtensionOfCompletedMovieWithURL(ready->clip, ready->finished);
    if (ready->finished) awaitLastRequests();
    if (ready->handed) ready->handed();
    std::lock_guard lock(mutex_);
    ++next_;
  }
}

/// While the clip of this number is handed over nobody finds the one after it: its turn comes only then.
std::optional<ClipHandover::Completed> ClipHandover::takeNext() {
  std::lock_guard lock(mutex_);
  auto next = completed_.extract(next_);
  return next ? std::optional(std::move(next.mapped())) : std::nullopt;
}

void ClipHandover::_notifyBroadcastExtensionOfCompletedMovieWithURL(const ClipFile& clip, bool finished) {
  QV_LOG(logs::kSession, "QVRecordingSession: notifyBroadcastExtensionOfCompletedMovieWithURL:");
  std::shared_ptr<platform::ExtensionUse> use;
  {
    std::lock_guard lock(mutex_);
    if (outstanding_ >= kMaximumOutstanding && !finished) {
      QV_LOG_ERROR(logs::kSession, "the broadcast extension is too far behind, a clip is left out");
      clip->remove(nullptr);
      return;
    }
    ++outstanding_;
    use = use_;
  }
  const auto token = use->issueSandboxToken(kReadTokenClass, clip->path());
  if (!token) {
    QV_LOG_ERROR(logs::kSession, "sb token is null!");
    std::lock_guard lock(mutex_);
    --outstanding_;
    return;
  }
  platform::ExtensionRequestHandlers handlers;
  handlers.began = [self = shared_from_this(), clip, token, weakUse = std::weak_ptr(use)](ExtensionRequestID,
                                                                                          const auto& error) {
    if (const auto living = error ? weakUse.lock() : nullptr) living->revokeSandboxToken(*token);
    self->requestBegan(clip, error);
  };
  handlers.completed = [self = shared_from_this(), clip](ExtensionRequestID, const auto& items) {
    self->requestCompleted(clip, items);
  };
  QV_LOG(logs::kSession, "begining extension request");
  use->beginRequest(itemsForClip(clip->url(), *token, finished), std::move(handlers));
}

std::vector<ExtensionItem> ClipHandover::itemsForClip(const URL& clip, const std::string& token, bool finished) const {
  return {itemWithTitle(broadcastitem::kRequestedFinish, Value(finished ? "1" : "0")),
          itemWithTitle(broadcastitem::kSandboxToken, Value(token)),
          itemWithTitle(broadcastitem::kUserInfo, Value(userInfo_)),
          itemWithTitle(broadcastitem::kMovieClipURL, Value(clip.absoluteString()))};
}

void ClipHandover::requestBegan(const ClipFile& clip, const std::optional<Error>& error) {
  QV_LOG(logs::kSession, "finished extension request with items with error code: %i)",
         error ? static_cast<int>(error->code) : 0);
  if (!error) return;
  requestEnded(clip);
  events_.extensionFailed();
}

void ClipHandover::requestCompleted(const ClipFile& clip, const Result<std::vector<ExtensionItem>>& items) {
  if (items) {
    for (const ExtensionItem& item : items.value()) loadReturnedItem(item);
  } else {
    QV_LOG_ERROR(logs::kSession, "the broadcast extension failed over a clip: %s", items.error().description().c_str());
    events_.extensionFailed();
  }
  requestEnded(clip);
}

void ClipHandover::requestEnded(const ClipFile& clip) {
  removeClip(*clip);
  std::shared_ptr<AnswerDeadline> last;  // answers when it goes, without the lock
  std::lock_guard lock(mutex_);
  if (--outstanding_ == 0 && isFinished_) last.swap(lastRequests_);
}

void ClipHandover::loadReturnedItem(const ExtensionItem& item) {
  if (item.attachments.empty()) return;
  const platform::ItemProvider& provider = item.attachments.front();
  if (!provider.hasItemConformingToTypeIdentifier(platform::kGenericDataType)) return;
  if (item.attributedTitle == broadcastitem::kBroadcastConfiguration) {
    QV_LOG(logs::kSession, "received updated broadcast configuration from extension");
    const auto configuration = QVBroadcastConfiguration::decodeReceived(provider.value.asData());
    if (!configuration) {
      QV_LOG_ERROR(logs::kSession, "Error loading input item for type");
      return;
    }
    events_.configurationReceived(configuration.value());
  } else if (item.attributedTitle == broadcastitem::kServiceInfo) {
    QV_LOG_DEBUG(logs::kSession, "received service info from broadcast service");
    events_.serviceInfoReceived(provider.value.asDictionary());
  }
}

void ClipHandover::awaitLastRequests() {
  // It holds this until the extension is let go, whatever becomes of the session. Where nobody keeps it, it answers
  // when it goes, without the lock.
  auto deadline = AnswerDeadline::start(platform_, kLastClipsPatience, [self = shared_from_this()](bool isLate) {
    if (isLate) QV_LOG_ERROR(logs::kSession, "the broadcast extension did not finish its last clips in time");
    std::shared_ptr<platform::ExtensionUse> ended;
    std::lock_guard lock(self->mutex_);
    ended.swap(self->use_);
  });
  std::lock_guard lock(mutex_);
  isFinished_ = true;
  if (outstanding_ > 0) lastRequests_ = std::move(deadline);
}

}  // namespace qv
