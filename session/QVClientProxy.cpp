#include "session/QVClientProxy.h"

#include "platform/threads/Log.h"

namespace qv {

using platform::Data;
using platform::Value;
namespace logs = platform::logs;

QVClientProxy::QVClientProxy(const QuorvelErrors& errors, std::string bundleIdentifier,
                             const std::shared_ptr<platform::IPCConnection>& connection)
    : errors_(errors), bundleIdentifier_(std::move(bundleIdentifier)), connection_(connection) {}

void QVClientProxy::send(const char* member, platform::IPCArguments arguments, const char* failureLine,
                         const std::shared_ptr<platform::RareLog>& failures) {
  const auto target = connection();
  if (!target) return;
  target->call(member, std::move(arguments), nullptr, [failureLine, failures](const platform::Error& error) {
    const auto number = failures ? failures->count() : std::optional<uint64_t>(1);
    if (!number) return;
    std::string line = failureLine;
    line.replace(line.find("%d"), 2, std::to_string(static_cast<int>(error.code)));
    if (*number > 1) line += " (" + std::to_string(*number) + " times)";
    QV_LOG_ERROR(logs::kDaemon, "%s", line.c_str());
  });
}

void QVClientProxy::updateScreenRecordingState(bool recording) {
  QV_LOG(logs::kDaemon, "QVClientProxy:updateScreenRecordingState:");
  send("updateScreenRecordingState", {Value(recording)},
       "QVClientProxy:updateScreenRecordingState: error getting remote proxy: %d");
}

void QVClientProxy::stopRecordingWithError(const std::optional<platform::Error>& error,
                                           const std::optional<platform::URL>& movieURL) {
  QV_LOG(logs::kDaemon, "QVClientProxy:stopRecordingWithError:movieURL:");
  send("stopRecordingWithError",
       {Value(errors_.encoded(error)), Value(movieURL ? movieURL->absoluteString() : std::string())},
       "QVClientProxy:recordingDidStopWithError: error getting remote proxy: %d");
}

void QVClientProxy::updateBroadcastServiceInfo(const platform::Dictionary& serviceInfo) {
  QV_LOG(logs::kDaemon, "QVClientProxy:updateBroadcastServiceInfo:");
  send("updateBroadcastServiceInfo", {Value(serviceInfo)},
       "QVClientProxy:updateBroadcastServiceInfo: error getting remote proxy: %d");
}

void QVClientProxy::updateBroadcastURL(const platform::URL& broadcastURL) {
  QV_LOG(logs::kDaemon, "QVClientProxy:updateBroadcastURL:");
  send("updateBroadcastURL", {Value(broadcastURL.absoluteString())},
       "QVClientProxy:updateBroadcastURL: error getting remote proxy: %d");
}

void QVClientProxy::captureHandlerWithSample(const QVSharedFrameObject& sample, Data timingData) {
  QV_LOG_DEBUG(logs::kDaemon, "QVClientProxy:captureHandlerWithSample:");
  send("captureHandlerWithSample", {sample.encodeForIPC(), Value(std::move(timingData))},
       "QVClientProxy:captureHandlerWithSample: error getting remote proxy: %d", lostFrames_);
}

void QVClientProxy::captureHandlerWithAudioSample(Data sample, Data absdData, int64_t itemCount, int64_t bufferType,
                                                  Data timingData) {
  QV_LOG_DEBUG(logs::kDaemon, "QVClientProxy:captureHandlerWithAudioSample:");
  send("captureHandlerWithAudioSample",
       {Value(std::move(sample)), Value(std::move(absdData)), Value(itemCount), Value(bufferType),
        Value(std::move(timingData))},
       "QVClientProxy:captureHandlerWithAudioSample: error getting remote proxy: %d", lostSound_);
}

void QVClientProxy::captureTimelineDidChange(Data pauses) {
  QV_LOG(logs::kDaemon, "QVClientProxy:captureTimelineDidChange:");
  send("captureTimelineDidChange", {Value(std::move(pauses))},
       "QVClientProxy:captureTimelineDidChange: error getting remote proxy: %d");
}

void QVClientProxy::recordingLockInterrupted(const platform::Error& error) {
  QV_LOG(logs::kDaemon, "QVClientProxy:recordingLockInterrupted:");
  send("recordingLockInterrupted", {Value(errors_.encoded(error))},
       "QVClientProxy:recordingLockInterrupted: error getting remote proxy: %d");
}

void QVClientProxy::recordingTimerDidUpdate(const std::string& time) {
  QV_LOG(logs::kDaemon, "QVClientProxy:recordingTimerDidUpdate:");
  send("recordingTimerDidUpdate", {Value(time)},
       "QVClientProxy:recordingTimerDidUpdate: error getting remote proxy: %d");
}

}  // namespace qv
