#include "session/StartAnswer.h"

#include <utility>

namespace qv {

using platform::Value;

StartAnswer::StartAnswer(const QuorvelErrors& errors, platform::IPCReply reply)
    : errors_(&errors), reply_(std::move(reply)) {}

StartAnswer::StartAnswer(StartAnswer&& other) noexcept
    : errors_(other.errors_), reply_(std::move(other.reply_)), isGiven_(std::exchange(other.isGiven_, true)) {}

StartAnswer::~StartAnswer() {
  if (!isGiven_) refused(recordingError(errorcode::kInterrupted));
}

void StartAnswer::started(RecordedInputs inputs) { give(std::nullopt, inputs); }

void StartAnswer::refused(const platform::Error& error) { give(error, {}); }

void StartAnswer::give(const std::optional<platform::Error>& error, RecordedInputs inputs) {
  if (std::exchange(isGiven_, true)) return;
  reply_({Value(errors_->encoded(error)), Value(inputs.microphone), Value(inputs.camera)});
  reply_ = {};
}

}  // namespace qv
