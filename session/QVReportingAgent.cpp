#include "session/QVReportingAgent.h"

#include <cmath>

#include "platform/threads/Log.h"

namespace qv {

using platform::Dictionary;
using platform::Value;
namespace logs = platform::logs;

namespace {

constexpr int32_t kClientType = 23;
constexpr int32_t kClientVersion = 1;
constexpr int32_t kAppAudioCaptureRate = 2;
constexpr int32_t kMicCaptureRate = 43;

/// To single precision, then to the nearest integer, halves away from zero.
int64_t roundedSingle(double value) { return std::llround(static_cast<float>(value)); }

std::string describe(const Dictionary& payload) {
  std::string text = "{";
  for (const auto& [key, value] : payload) {
    text += text.size() > 1 ? ", " + key + "=" : key + "=";
    text += value.isNumber() ? std::to_string(value.asInteger()) : "\"" + value.asString() + "\"";
  }
  return text + "}";
}

}  // namespace

void QVReportingAgent::addActiveDuration(double seconds) {
  double current = activeDuration_;
  while (!activeDuration_.compare_exchange_weak(current, current + seconds)) {
  }
}

void QVReportingAgent::setVideoCapture(platform::Size size, int64_t rate) {
  videoCaptureSize_.store(size);
  videoCaptureRate_ = rate;
}

void QVReportingAgent::setCameraUsed(int32_t position) {
  if (position == static_cast<int32_t>(CameraPosition::Back)) backCameraUsed_ = true;
  if (position == static_cast<int32_t>(CameraPosition::Front)) frontCameraUsed_ = true;
}

Dictionary QVReportingAgent::collectSummaryEventMetrics() const {
  const platform::Size size = videoCaptureSize_.load();
  return {
      {"ActiveDuration", Value(roundedSingle(activeDuration_))},
      {"VideoCaptureWidth", Value(roundedSingle(size.width))},
      {"VideoCaptureHeight", Value(roundedSingle(size.height))},
      {"VideoCaptureRate", Value(videoCaptureRate_.load())},
      {"VideoFrameCount", Value(videoFrameCount_.load())},
      {"AppAudioCaptureRate", Value(kAppAudioCaptureRate)},
      {"AppAudioFrameCount", Value(appAudioFrameCount_.load())},
      {"MicCaptureRate", Value(kMicCaptureRate)},
      {"MicFrameCount", Value(micFrameCount_.load())},
      {"FrontCameraUsed", Value(frontCameraUsed_.load())},
      {"BackCameraUsed", Value(backCameraUsed_.load())},
      {"RecordedFileSize", Value(recordedFileSize_.load())},
      {"BroadcastExtensionBundleID", Value("")},
      {"ClientAppBundleID", Value("")},
      {"EndReason", Value(endReason_.load())},
  };
}

void QVReportingAgent::reportEventWithType(uint16_t eventType, const Dictionary& dictionary) const {
  if (dictionary.empty()) {
    QV_LOG_ERROR(logs::kSession, "QVReportingAgent: payloadDict cannot be null!");
    return;
  }
  QV_LOG(logs::kSession, "QVReportingAgent: reportingEvent:%d payload:%s", eventType, describe(dictionary).c_str());
  platform::MetricsMessage message;
  message.clientType = kClientType;
  message.clientVersion = kClientVersion;
  message.batchEvent = true;
  message.userInfoRequired = true;
  message.clientName = "Quorvel";
  message.serviceName = serviceName_;
  message.category = eventType;
  message.payload = dictionary;
  message.droppedPictures = droppedPictures_.load();
  if (const auto error = metrics_.sendMessage(message)) {
    QV_LOG_ERROR(logs::kSession, "eventType:%d error code %d.", eventType, static_cast<int>(error->code));
  }
}

}  // namespace qv
