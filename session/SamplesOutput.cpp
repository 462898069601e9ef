#include "session/SamplesOutput.h"

#include <utility>

#include "platform/threads/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
using platform::Result;
namespace logs = platform::logs;

SamplesOutput::~SamplesOutput() { letGo(); }

void SamplesOutput::letGo() {
  Link former;
  {
    std::lock_guard lock(mutex_);
    former = std::exchange(broadcastUploadExtensionProxy_, nullptr);
  }
  if (former) former->invalidateConnection();
}

Result<SamplesOutput::Link> SamplesOutput::makeLink() const {
  QV_LOG(logs::kSession, "setting up extension proxy");
  if (plan_.listenerEndpoint.isValid()) {
    return QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(platform_, plan_.listenerEndpoint);
  }
  return QVBroadcastExtensionProxy::withBroadcastUploadExtension(platform_, plan_.info.extension);
}

void SamplesOutput::prepare(ReadyHandler handler) {
  auto made = makeLink();
  if (!made) {
    QV_LOG_ERROR(logs::kSession, "nobody listens at the extension's endpoint: %s", made.error().description().c_str());
    handler(made.error());
    return;
  }
  adopt(*made);
  if (plan_.listenerEndpoint.isValid()) {
    handler(std::nullopt);
  } else {
    launch(*made, std::move(handler));
  }
}

void SamplesOutput::adopt(const Link& link) {
  link->setServiceInfoHandler([weak = weak_from_this()](const platform::Dictionary& serviceInfo) {
    if (const auto self = weak.lock()) self->events_.serviceInfoReceived(serviceInfo);
  });
  link->setBroadcastURLHandler([weak = weak_from_this()](const platform::URL& broadcastURL) {
    if (const auto self = weak.lock()) self->events_.broadcastURLReceived(broadcastURL);
  });
  link->setErrorHandler([weak = weak_from_this()](const Error& error) {
    if (const auto self = weak.lock()) self->linkFailed(error);
  });
  std::lock_guard lock(mutex_);
  broadcastUploadExtensionProxy_ = link;
}

/// An extension may ping as often as it likes; the start goes on once.
void SamplesOutput::launch(const Link& link, ReadyHandler handler) {
  const auto waiting = std::make_shared<ReadyHandler>(std::move(handler));
  link->establishConnectionWithHandler([weak = weak_from_this(), waiting](const std::optional<Error>& error) {
    const auto whenReady = std::exchange(*waiting, nullptr);
    const auto self = weak.lock();
    if (!self || !whenReady) return;
    if (!error) QV_LOG(logs::kSession, "connection to extensions ready");
    whenReady(error);
  });
}

/// On the link's queue, or where an answer is late. To let go gives up every answer that is waited for.
void SamplesOutput::linkFailed(const Error& error) {
  events_.failed(error);
  letGo();
}

void SamplesOutput::start(ReadyHandler handler) {
  notifyExtensionAndWait(BroadcastAction::Started, [handler = std::move(handler)] { handler(std::nullopt); });
}

void SamplesOutput::pause() {
  _notifyExtensionOfAction(BroadcastAction::Paused, [] {});
}

void SamplesOutput::resume() {
  _notifyExtensionOfAction(BroadcastAction::Resumed, [] {});
}

/// The link is let go of first: whoever hears of the end may start the same extension again at once.
void SamplesOutput::finish(platform::MediaTime, FinishHandler handler) {
  notifyExtensionAndWait(BroadcastAction::Finished, [self = shared_from_this(), handler = std::move(handler)] {
    self->letGo();
    handler({});
  });
}

void SamplesOutput::notifyExtensionAndWait(BroadcastAction action, std::function<void()> completion) {
  auto deadline = AnswerDeadline::start(
      platform_, kExtensionPatience,
      [self = shared_from_this(), action, completion = std::move(completion)](bool isLate) {
        if (isLate) {
          QV_LOG_ERROR(logs::kSession, "the broadcast extension has not answered action %i in time",
                       static_cast<int>(action));
          self->linkFailed(recordingError(errorcode::kInvalidBroadcastSession));
        }
        completion();
      });
  _notifyExtensionOfAction(action, [deadline] { deadline->answer(); });
}

}  // namespace qv
