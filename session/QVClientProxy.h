#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>

#include "platform/IPC.h"
#include "platform/threads/Guarded.h"
#include "platform/threads/RareLog.h"
#include "protocol/SampleCoding.h"
#include "support/QuorvelErrors.h"

namespace qv {

/// What a session may know of its client: turns each callback into a one-way message over the
/// client's connection. It holds that connection but does not own it; without one, messages go
/// nowhere. Nothing is retried, and failures are only logged: those of samples as their number doubles.
///
/// Threading: thread-safe; called from the manager sequence and from capture threads.
class QVClientProxy {
 public:
  /// The errors' texts are borrowed, and must outlive this.
  QVClientProxy(const QuorvelErrors& errors, std::string bundleIdentifier,
                const std::shared_ptr<platform::IPCConnection>& connection);

  /// Nothing when the client has gone or was replaced.
  [[nodiscard]] std::shared_ptr<platform::IPCConnection> connection() const { return connection_.load().lock(); }
  void setConnection(const std::shared_ptr<platform::IPCConnection>& connection) { connection_.store(connection); }
  [[nodiscard]] const std::string& bundleIdentifier() const { return bundleIdentifier_; }

  /// For the system's own clients: whether anything is recorded.
  void updateScreenRecordingState(bool recording);
  void stopRecordingWithError(const std::optional<platform::Error>& error,
                              const std::optional<platform::URL>& movieURL);
  void updateBroadcastServiceInfo(const platform::Dictionary& serviceInfo);
  void updateBroadcastURL(const platform::URL& broadcastURL);
  /// Counts in `dropped` (may be nothing) what the client was too slow to be sent; maybe after this has gone.
  void captureHandlerWithSample(const PictureMessage& picture, const std::shared_ptr<std::atomic<uint64_t>>& dropped);
  void captureHandlerWithAudioSample(SoundMessage sound);
  /// The sum of the pauses before the samples that follow.
  void captureTimelineDidChange(platform::MediaTime pauses);
  void recordingLockInterrupted(const platform::Error& error);
  /// For the system's own clients: how long, as "1:05".
  void recordingTimerDidUpdate(const std::string& time);

 private:
  /// `failures` (may be nothing) counts those of a member that is sent all the time, `dropped` what did not fit.
  void send(OutgoingCall call, const char* failureLine, const std::shared_ptr<platform::RareLog>& failures = nullptr,
            const std::shared_ptr<std::atomic<uint64_t>>& dropped = nullptr);

  const QuorvelErrors& errors_;
  const std::string bundleIdentifier_;
  /// Failures come back later than this may live.
  const std::shared_ptr<platform::RareLog> lostFrames_ = std::make_shared<platform::RareLog>();
  const std::shared_ptr<platform::RareLog> lostSound_ = std::make_shared<platform::RareLog>();
  platform::Guarded<std::weak_ptr<platform::IPCConnection>> connection_;
};

}  // namespace qv
