#include "sdk/c/CSamples.h"

#include <utility>

namespace qv::c {
namespace {

int64_t nanoseconds(const std::optional<quorvel::SampleTime>& duration) {
  return duration ? duration->count() : QUORVEL_NO_DURATION;
}

}  // namespace

CVideoFrame::CVideoFrame(quorvel::VideoFrame frame) : kept(std::move(frame)) {
  pixels = kept.pixels.data();
  width = kept.width;
  height = kept.height;
  stride = kept.stride;
  presentation_time = kept.presentationTime.count();
  duration = nanoseconds(kept.duration);
}

CAudioSample::CAudioSample(quorvel::AudioSample sample) : kept(std::move(sample)) {
  const bool isMicrophone = kept.source == quorvel::AudioSample::Source::Microphone;
  source = isMicrophone ? QUORVEL_AUDIO_MICROPHONE : QUORVEL_AUDIO_APPLICATION;
  bytes = kept.bytes.data();
  size = kept.bytes.size();
  frame_count = kept.frameCount;
  presentation_time = kept.presentationTime.count();
  duration = nanoseconds(kept.duration);
  sample_rate = kept.format.sampleRate;
  channels = kept.format.channels;
  bits_per_channel = kept.format.bitsPerChannel;
  bytes_per_frame = kept.format.bytesPerFrame;
  is_float = kept.format.isFloat;
  is_signed = kept.format.isSigned;
  is_big_endian = kept.format.isBigEndian;
}

}  // namespace qv::c

using qv::c::CAudioSample;
using qv::c::CVideoFrame;

const quorvel_video_frame* quorvel_video_frame_retain(const quorvel_video_frame* frame) {
  return qv::c::retain<CVideoFrame>(frame);
}
void quorvel_video_frame_release(const quorvel_video_frame* frame) { qv::c::release<CVideoFrame>(frame); }
const quorvel_audio_sample* quorvel_audio_sample_retain(const quorvel_audio_sample* sample) {
  return qv::c::retain<CAudioSample>(sample);
}
void quorvel_audio_sample_release(const quorvel_audio_sample* sample) { qv::c::release<CAudioSample>(sample); }
