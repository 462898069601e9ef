#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "daemon/Caller.h"
#include "daemon/ForegroundFollower.h"
#include "daemon/QVBroadcastBook.h"
#include "daemon/SessionRegistry.h"
#include "platform/UserAlert.h"
#include "protocol/QVDaemonProtocol.h"
#include "ui/QVAcknowledgementAlert.h"
#include "ui/QVExemptionBook.h"

namespace qv {

/// What starts need of the daemon.
struct StartServices {
  platform::SerialQueue& sequence;
  RecordingContext& context;
  SessionRegistry& sessions;
  ForegroundFollower& foreground;
  QVBroadcastBook& broadcasts;
  QVExemptionBook& exemptions;
  const QVAcknowledgementAlert& acknowledgements;
  /// Ends all that records, as its first step.
  std::function<void()> stopCurrentRecordings;
  /// Ends what has begun to record meanwhile.
  std::function<void(const SessionRegistry::Session&)> interruptOthers;
  /// The sources run; the client is about to be told.
  std::function<void(const SessionRegistry::Session&)> willAnswer;
  /// The client was told.
  std::function<void(const SessionRegistry::Session&)> didAnswer;
};

/// One start on its way, from its checks to its answer. It waits for ending recordings, for the user, for a process id;
/// the daemon does not. From `begin` on the recording owns the answer, and whatever ends it ends the start.
///
/// Threading: sequence only.
class StartFlow : public std::enable_shared_from_this<StartFlow> {
 public:
  using Session = SessionRegistry::Session;
  StartFlow(StartServices& services, Session session, request::StartRecording request, platform::IPCReply reply,
            std::function<void()> over);

  void run();
  /// Nobody waits for it any more. What it has begun to record of an application ends, without a movie; a system
  /// recording needs no client and goes on. Then the start is not over.
  void cancel();
  [[nodiscard]] const std::shared_ptr<QVRecording>& recording() const { return recording_; }

 private:
  void continueAfterStops();
  void showAcknowledgementAlertForSession();
  void continueAfterAcknowledgement(const AcknowledgementAnswer& answer);
  [[nodiscard]] bool isAlertSuppressed() const;
  void begin();
  [[nodiscard]] RecordingSettings settings(const QVBroadcastInfo* broadcast) const;
  void continueAfterPreparing();
  void frontmostSession(std::function<void(int32_t processID)> handler);
  void recordingStarted();
  [[nodiscard]] bool isInFront() const;
  void refuse(const platform::Error& error);

  StartServices& services_;
  const Session session_;
  const request::StartRecording request_;
  /// Tells the owner, which then lets go of this.
  const std::function<void()> over_;
  /// Until the recording has it.
  std::optional<StartAnswer> answer_;
  /// As the device can and the user allows.
  RecordedInputs inputs_;
  /// Goes with this; what its answer says after that reaches nobody.
  std::unique_ptr<platform::UserAlert> alert_;
  std::shared_ptr<QVRecording> recording_;
};

}  // namespace qv
