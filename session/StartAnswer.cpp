#include "session/StartAnswer.h"

#include <utility>

#include "support/QuorvelErrors.h"

namespace qv {

using platform::Value;

StartAnswer::StartAnswer(platform::IPCReply reply) : reply_(std::move(reply)) {}

StartAnswer::StartAnswer(StartAnswer&& other) noexcept
    : reply_(std::move(other.reply_)), isGiven_(std::exchange(other.isGiven_, true)) {}

StartAnswer::~StartAnswer() {
  if (!isGiven_) refused(_qvUserErrorForCode(errorcode::kInterrupted));
}

void StartAnswer::started(RecordedInputs inputs) { give(std::nullopt, inputs); }

void StartAnswer::refused(const platform::Error& error) { give(error, {}); }

void StartAnswer::give(const std::optional<platform::Error>& error, RecordedInputs inputs) {
  if (std::exchange(isGiven_, true)) return;
  reply_({Value(platform::encodeError(error)), Value(inputs.microphone), Value(inputs.camera)});
  reply_ = {};
}

}  // namespace qv
