#include <utility>

#include "platform/Log.h"
#include "session/QVRecordingSession.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::URL;
namespace logs = platform::logs;

void QVRecordingSession::setBroadcastConfiguration(std::optional<QVBroadcastConfiguration> configuration) {
  broadcastConfiguration_.store(std::move(configuration));
}

void QVRecordingSession::enableBroadcastWithExtension(const platform::ExtensionRecordRef& extension,
                                                      BroadcastProcessMode processMode, const Dictionary& userInfo,
                                                      const platform::ListenerEndpoint& listenerEndpoint,
                                                      EnableHandler handler) {
  QV_LOG(logs::kSession, "QVRecordingSession: enableBroadcastWithExtension");
  broadcastExtension_.store(extension);
  broadcastUserInfo_.store(userInfo);
  broadcastFragmentIndex_ = 1;
  broadcastProcessMode_ = processMode;
  earlyBroadcastFailure_.store(std::nullopt);
  if (processMode != BroadcastProcessMode::Samples) {
    sequence_.async([handler = std::move(handler)] { handler(std::nullopt); });
    return;
  }
  QV_LOG(logs::kSession, "setting up extension proxy");
  if (!listenerEndpoint.isValid()) {
    const auto proxy = QVBroadcastExtensionProxy::withBroadcastUploadExtension(extension);
    adoptExtensionProxy(proxy);
    launchExtension(proxy, std::move(handler));
    return;
  }
  auto proxy = QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(listenerEndpoint);
  if (proxy) {
    adoptExtensionProxy(*proxy);
  } else {
    QV_LOG_ERROR(logs::kSession, "nobody listens at the extension's endpoint: %s", proxy.error().description().c_str());
    disableBroadcast();
  }
  const std::optional<Error> error = proxy ? std::nullopt : std::optional(proxy.error());
  sequence_.async([error, handler = std::move(handler)] { handler(error); });
}

void QVRecordingSession::adoptExtensionProxy(const std::shared_ptr<QVBroadcastExtensionProxy>& proxy) {
  proxy->setServiceInfoHandler([weakSelf = weak_from_this()](const Dictionary& serviceInfo) {
    const auto self = weakSelf.lock();
    const auto client = self ? self->clientProxy() : nullptr;
    if (client) client->updateBroadcastServiceInfo(serviceInfo);
  });
  proxy->setBroadcastURLHandler([weakSelf = weak_from_this()](const URL& broadcastURL) {
    const auto self = weakSelf.lock();
    const auto client = self ? self->clientProxy() : nullptr;
    if (client) client->updateBroadcastURL(broadcastURL);
  });
  proxy->setErrorHandler([weakSelf = weak_from_this()](const Error& error) {
    if (const auto self = weakSelf.lock()) self->broadcastFailed(error);
  });
  broadcastUploadExtensionProxy_.store(proxy);
}

/// An extension may ping as often as it likes; the start goes on once.
void QVRecordingSession::launchExtension(const std::shared_ptr<QVBroadcastExtensionProxy>& proxy,
                                         EnableHandler handler) {
  const auto waiting = std::make_shared<EnableHandler>(std::move(handler));
  proxy->establishConnectionWithHandler(
      [weakSelf = weak_from_this(), weakProxy = std::weak_ptr(proxy), waiting](const std::optional<Error>& error) {
        const auto self = weakSelf.lock();
        if (!self) return;
        self->sequence_.async([self, weakProxy, waiting, error] {
          const auto established = weakProxy.lock();
          const auto whenEnabled = std::exchange(*waiting, nullptr);
          if (!whenEnabled || !established || self->broadcastUploadExtensionProxy_.load() != established) return;
          if (error) {
            self->abandonBroadcast();
          } else {
            QV_LOG(logs::kSession, "connection to extensions ready");
          }
          whenEnabled(error);
        });
      });
}

void QVRecordingSession::disableBroadcast() {
  QV_LOG(logs::kSession, "QVRecordingSession: disableBroadcast");
  broadcastExtension_.store(nullptr);
  broadcastUserInfo_.store({});
  broadcastConfiguration_.store(std::nullopt);
  broadcastProcessMode_ = BroadcastProcessMode::MovieClips;
  earlyBroadcastFailure_.store(std::nullopt);
}

void QVRecordingSession::abandonBroadcast() {
  disableBroadcast();
  if (const auto proxy = broadcastUploadExtensionProxy_.exchange(nullptr)) proxy->invalidateConnection();
}

/// On the link's queue, or where an answer is late.
void QVRecordingSession::broadcastFailed(const Error& error) {
  if (recording_) {
    stopRecordingWithNotification(true, error);
  } else {
    earlyBroadcastFailure_.store(error);
  }
  if (const auto proxy = broadcastUploadExtensionProxy_.exchange(nullptr)) proxy->invalidateConnection();
  if (const auto awaited = awaitedAnswer_.exchange(nullptr)) awaited->answer();
}

void QVRecordingSession::_notifyExtensionOfAction(BroadcastAction action, std::function<void()> completion) {
  if (broadcastProcessMode_ != BroadcastProcessMode::Samples) {
    completion();
    return;
  }
  const auto proxy = readyExtensionProxy();
  if (!proxy) {
    completion();
    return;
  }
  BroadcastPayload payload;
  payload.entries = {{broadcastpayload::kActionType, platform::Value(static_cast<int64_t>(action))},
                     {broadcastpayload::kUserInfo, platform::Value(broadcastUserInfo_.load())}};
  proxy->processPayload(std::move(payload), std::move(completion));
}

void QVRecordingSession::notifyExtensionAndWait(BroadcastAction action, std::function<void()> completion) {
  auto deadline = AnswerDeadline::start(
      kExtensionPatience, [self = shared_from_this(), action, completion = std::move(completion)](bool isLate) {
        if (isLate) {
          QV_LOG_ERROR(logs::kSession, "the broadcast extension has not answered action %i in time",
                       static_cast<int>(action));
          self->broadcastFailed(_qvUserErrorForCode(errorcode::kInvalidBroadcastSession));
        }
        completion();
      });
  awaitedAnswer_.store(deadline);
  _notifyExtensionOfAction(action, [deadline] { deadline->answer(); });
}

bool QVRecordingSession::isBroadcastOpen() const {
  std::lock_guard lock(clipLock_);
  return clips_.handover || broadcastUploadExtensionProxy_.load();
}

void QVRecordingSession::finishBroadcast(std::function<void()> handler) {
  if (broadcastProcessMode_ != BroadcastProcessMode::Samples) {
    finishClips(std::move(handler));
    return;
  }
  notifyExtensionAndWait(BroadcastAction::Finished, [self = shared_from_this(), handler = std::move(handler)] {
    handler();
    if (const auto proxy = self->broadcastUploadExtensionProxy_.exchange(nullptr)) proxy->invalidateConnection();
  });
}

}  // namespace qv
