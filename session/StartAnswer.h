#pragma once

#include "platform/IPC.h"
#include "support/QuorvelErrors.h"

namespace qv {

/// What a start records besides the screen, as its client is told.
struct RecordedInputs {
  bool microphone = false;
  bool camera = false;
};

/// The answer that the client of a start waits for. It is given once; destroyed unanswered, it answers that the
/// recording was interrupted, so that no way out of a start can forget its client.
///
/// Threading: thread-safe as its reply is; one owner at a time.
class StartAnswer {
 public:
  /// The errors' texts are borrowed, and must outlive this.
  StartAnswer(const QuorvelErrors& errors, platform::IPCReply reply);
  ~StartAnswer();
  StartAnswer(StartAnswer&& other) noexcept;
  StartAnswer& operator=(StartAnswer&&) = delete;

  [[nodiscard]] bool isGiven() const { return isGiven_; }
  void started(RecordedInputs inputs);
  void refused(const platform::Error& error);

 private:
  void give(const std::optional<platform::Error>& error, RecordedInputs inputs);

  const QuorvelErrors* errors_;
  platform::IPCReply reply_;
  bool isGiven_ = false;
};

}  // namespace qv
