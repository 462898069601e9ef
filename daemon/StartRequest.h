#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "platform/IPC.h"
#include "platform/UserAlert.h"
#include "session/QVRecordingSession.h"

namespace qv {

/// Threading: manager sequence only.
struct StartRequest {
  std::shared_ptr<QVRecordingSession> session;
  std::weak_ptr<platform::IPCConnection> connection;
  platform::IPCReply reply;

  // What was asked.
  std::vector<uint32_t> contextIDs;
  platform::Size windowSize;
  bool microphoneEnabled = false;
  bool cameraEnabled = false;
  bool broadcast = false;
  bool systemRecording = false;
  bool captureEnabled = false;
  platform::ListenerEndpoint listenerEndpoint;

  // Where it stands.
  bool microphoneRecording = false;  ///< as the user allowed it
  bool cameraRecording = false;
  std::unique_ptr<platform::UserAlert> alert;
  uint64_t generation = 0;
  bool isOver = false;
};

}  // namespace qv
