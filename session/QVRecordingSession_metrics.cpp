#include "platform/Log.h"
#include "session/QVRecordingSession.h"

namespace qv {

namespace logs = platform::logs;

namespace {
constexpr const char kSystemRecording[] = "SystemRecording";
constexpr const char kInAppRecording[] = "InAppRecording";
}  // namespace

std::string QVRecordingSession::_serviceNameForReporting() const {
  if (systemRecording_) return isBroadcasting_ ? "SystemBroadcast" : kSystemRecording;
  if (isBroadcasting_) return "InAppBroadcast";
  return captureRecording_ ? "InAppCapture" : kInAppRecording;
}

uint64_t QVRecordingSession::getRecordedFileSize() const {
  const auto agent = reportingAgent();
  if (!agent || (agent->serviceName() != kSystemRecording && agent->serviceName() != kInAppRecording)) return 0;
  const auto writer = movieWriter();
  const auto attributes = writer
                              ? platform::Platform::current().fileSystem->attributesOfItem(writer->outputURL().path())
                              : platform::Result<platform::FileAttributes>(platform::Error::posix(ENOENT));
  if (!attributes) {
    QV_LOG_ERROR(logs::kSession, "error getting recordedFileSize :%ld", static_cast<long>(attributes.error().code));
    return 0;
  }
  QV_LOG(logs::kSession, "recordedFileSize for URL %lu bytes", static_cast<unsigned long>(attributes.value().size));
  return attributes.value().size;
}

void QVRecordingSession::reportSummaryEvent(int64_t endReason) {
  const auto agent = reportingAgent();
  if (!agent) return;
  agent->setRecordedFileSize(getRecordedFileSize());
  agent->setEndReason(endReason);
  agent->reportEventWithType(QVReportingAgent::kSessionSummaryEvent, agent->collectSummaryEventMetrics());
  reportingAgent_.store(nullptr);
}

void QVRecordingSession::sessionReportCameraUsage(int32_t cameraPosition) {
  if (const auto agent = reportingAgent()) agent->setCameraUsed(cameraPosition);
}

}  // namespace qv
