#include "platform/RawRecord.h"
#include "session/QVRecordingSession.h"

namespace qv {

using platform::Data;
using platform::SampleBufferRef;

void QVRecordingSession::packageVideoSampleBufferForCapture(const SampleBufferRef& sample) {
  QVSharedFrameObject frame;
  frame.setSharedFrame(sample->image()->sharedFrame());
  if (const auto proxy = clientProxy()) proxy->captureHandlerWithSample(frame, rawBytes(sample->timing().front()));
}

void QVRecordingSession::packageAudioSampleBufferForCapture(const SampleBufferRef& sample, SampleType type) {
  const auto bytes = sample->data()->bytes();
  if (const auto proxy = clientProxy()) {
    proxy->captureHandlerWithAudioSample(Data(bytes.begin(), bytes.end()),
                                         rawBytes(sample->audioFormat()->streamDescription), sample->numSamples(),
                                         static_cast<int64_t>(type), rawBytes(sample->timing().front()));
  }
}

}  // namespace qv
