#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "daemon/RecordingIndicator.h"
#include "session/QVClientProxy.h"

namespace qv {

/// Who is told that something is recorded, whoever asked for it: the user, by the indicator, and the system's own
/// clients, by messages. A device whose interface has a status bar of its own (property "ownStatusBar") shows no
/// indicator.
///
/// Threading: sequence only. It must be held by a shared pointer.
class RecordingNotices : public std::enable_shared_from_this<RecordingNotices> {
 public:
  using Stop = std::function<void(const std::shared_ptr<QVRecording>&)>;
  /// `stop`: the user wants this recording to end.
  RecordingNotices(std::shared_ptr<RecordingContext> context, Stop stop)
      : context_(std::move(context)), stop_(std::move(stop)) {}

  /// One at a time is told of.
  void recordingStarted(const std::shared_ptr<QVRecording>& recording);
  /// Nothing happens where another one is shown.
  void recordingWillStop(const QVRecording& recording);
  /// One of the system's own clients has connected: it is told what is so now, and what changes.
  void systemClientConnected(const std::shared_ptr<QVClientProxy>& client);

 private:
  [[nodiscard]] std::vector<std::shared_ptr<QVClientProxy>> connectedClients();

  const std::shared_ptr<RecordingContext> context_;
  const Stop stop_;
  std::shared_ptr<RecordingIndicator> indicator_;  ///< while something is recorded
  std::vector<std::weak_ptr<QVClientProxy>> clients_;
};

}  // namespace qv
