#include "SoundEncoder.h"

#include <utility>

#include "PictureEncoder.h"

namespace upload {

std::unique_ptr<SoundEncoder> SoundEncoder::open(int bitRate, bool hasGlobalHeader) {
  const AVCodec* codec = avcodec_find_encoder(AV_CODEC_ID_AAC);
  if (codec == nullptr) return nullptr;
  CodecContext context(avcodec_alloc_context3(codec));
  context->sample_fmt = AV_SAMPLE_FMT_FLTP;
  context->sample_rate = kSoundRate;
  context->time_base = {1, kSoundRate};
  context->bit_rate = bitRate;
  context->ch_layout = AV_CHANNEL_LAYOUT_STEREO;
  if (hasGlobalHeader) context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
  if (avcodec_open2(context.get(), codec, nullptr) < 0 || context->frame_size != kChunkSamples) return nullptr;
  std::unique_ptr<SoundEncoder> encoder(new SoundEncoder(std::move(context)));
  AVFrame& frame = *encoder->frame_;
  frame.format = AV_SAMPLE_FMT_FLTP;
  frame.sample_rate = kSoundRate;
  frame.nb_samples = kChunkSamples;
  av_channel_layout_copy(&frame.ch_layout, &encoder->context_->ch_layout);
  return av_frame_get_buffer(&frame, 0) == 0 ? std::move(encoder) : nullptr;
}

SoundEncoder::SoundEncoder(CodecContext context) : context_(std::move(context)), frame_(av_frame_alloc()) {}

void SoundEncoder::encode(const SoundMixer::Chunk& chunk, const std::function<void(Packet)>& output) {
  if (av_frame_make_writable(frame_.get()) < 0) return;
  for (int channel = 0; channel < 2; ++channel) {
    auto* samples = reinterpret_cast<float*>(frame_->data[channel]);
    for (int i = 0; i < kChunkSamples; ++i) samples[i] = chunk.frames[static_cast<size_t>(2 * i + channel)];
  }
  frame_->pts = chunk.position;
  if (avcodec_send_frame(context_.get(), frame_.get()) < 0) return;
  for (Packet packet(av_packet_alloc()); avcodec_receive_packet(context_.get(), packet.get()) == 0;
       packet.reset(av_packet_alloc())) {
    av_packet_rescale_ts(packet.get(), context_->time_base, kMicroseconds);
    output(std::move(packet));
  }
}

}  // namespace upload
