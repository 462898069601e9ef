#include "extensions/LinkHandshake.h"

#include "platform/threads/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {
std::shared_ptr<LinkHandshake> LinkHandshake::start(const platform::Platform& platform, Handler handler) {
  auto handshake = std::make_shared<LinkHandshake>(std::move(handler));
  handshake->deadline_ =
      AnswerDeadline::start(platform, kExtensionPatience, [weak = std::weak_ptr(handshake)](bool isLate) {
        const auto self = weak.lock();
        if (!isLate || !self) return;
        if (self->stage_ == Stage::Waiting) {
          QV_LOG_ERROR(platform::logs::kExtensions, "the extension did not connect and ping in time");
        }
        self->fail(recordingError(errorcode::kInvalidBroadcastSession));
      });
  return handshake;
}

LinkHandshake::~LinkHandshake() { fail(recordingError(errorcode::kInvalidBroadcastSession)); }

void LinkHandshake::succeed() {
  Stage stage = Stage::Waiting;
  if (!stage_.compare_exchange_strong(stage, Stage::Ready) && stage == Stage::Failed) return;
  if (handler_) handler_(std::nullopt);
}

void LinkHandshake::fail(const platform::Error& error) {
  Stage stage = Stage::Waiting;
  if (stage_.compare_exchange_strong(stage, Stage::Failed) && handler_) handler_(error);
}

}  // namespace qv
