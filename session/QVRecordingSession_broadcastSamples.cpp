#include "platform/Log.h"
#include "platform/RawRecord.h"
#include "session/QVRecordingSession.h"

namespace qv {

using platform::Data;
using platform::SampleBufferRef;
using platform::Value;
namespace logs = platform::logs;

std::shared_ptr<QVBroadcastExtensionProxy> QVRecordingSession::readyExtensionProxy() const {
  if (!hasBroadcastExtension()) {
    QV_LOG(logs::kSession, "no broadcast extension found!");
    return nullptr;
  }
  auto proxy = broadcastUploadExtensionProxy_.load();
  if (!proxy) QV_LOG(logs::kSession, "broadcast extension not ready");
  return proxy;
}

void QVRecordingSession::_notifyExtensionOfVideoSampleBuffer(const SampleBufferRef& sample, SampleType type,
                                                             uint32_t orientation) {
  const auto proxy = readyExtensionProxy();
  if (!proxy) return;
  BroadcastPayload payload;
  payload.kind = BroadcastPayload::Kind::Video;
  payload.entries = {{broadcastpayload::kVideoOrientation, Value(orientation)},
                     {broadcastpayload::kSampleType, Value(static_cast<int64_t>(type))},
                     {broadcastpayload::kTimingInfo, Value(rawBytes(sample->timing().front()))}};
  payload.frame.setSharedFrame(sample->image()->sharedFrame());
  proxy->processPayload(std::move(payload), [] {
    QV_LOG_DEBUG(logs::kSession, "quorveld sending video payload to broadcast extension...");
  });
}

void QVRecordingSession::_notifyExtensionOfAudioSampleBuffer(const SampleBufferRef& sample, SampleType type) {
  const auto proxy = readyExtensionProxy();
  if (!proxy) return;
  const auto bytes = sample->data()->bytes();
  const platform::AudioStreamDescription& format = sample->audioFormat()->streamDescription;
  BroadcastPayload payload;
  payload.kind = type == SampleType::Microphone ? BroadcastPayload::Kind::Microphone : BroadcastPayload::Kind::AppAudio;
  payload.duration = format.sampleRate > 0 ? static_cast<double>(sample->numSamples()) / format.sampleRate : 0;
  payload.entries = {{broadcastpayload::kSampleType, Value(static_cast<int64_t>(type))},
                     {broadcastpayload::kAudioBufferList, Value(Data(bytes.begin(), bytes.end()))},
                     {broadcastpayload::kAudioFormatDescription, Value(rawBytes(format))},
                     {broadcastpayload::kTimingInfo, Value(rawBytes(sample->timing().front()))},
                     {broadcastpayload::kNumSamples, Value(sample->numSamples())}};
  proxy->processPayload(std::move(payload), [] {
    QV_LOG_DEBUG(logs::kSession, "quorveld sending audio payload to broadcast extension...");
  });
}

void QVRecordingSession::_notifyExtensionOfFrontmostProcessBundleID(const std::string& bundleID) {
  const auto proxy = readyExtensionProxy();
  if (!proxy) return;
  BroadcastPayload payload;
  payload.entries = {{broadcastpayload::kFrontmostApp, Value(bundleID)}};
  proxy->processPayload(std::move(payload), [] {
    QV_LOG(logs::kSession, "quorveld sending frontmost app bundleID to broadcast extension...");
  });
}

}  // namespace qv
