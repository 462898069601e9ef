#include "platform/ffmpeg/AACEncoder.h"

#include <algorithm>
#include <cstring>

#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

constexpr int kFramesPerPacket = 1024;
/// After this many blocks of silence the encoder's state is that of silence, and so is its latest packet.
constexpr int kSettlingPackets = 4;

Error encoderError(int code) { return mp4::movieError(mp4::kMovieEncoderFailed, "AAC encoder: " + errorText(code)); }

CodecContext makeContext(const AVCodec* codec, const AudioSettings& settings) {
  CodecContext context(avcodec_alloc_context3(codec));
  context->sample_fmt = AV_SAMPLE_FMT_FLTP;
  context->sample_rate = settings.sampleRate;
  context->bit_rate = settings.bitRate;
  context->time_base = {1, settings.sampleRate};
  context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
  context->thread_count = 1;
  av_channel_layout_default(&context->ch_layout, 2);
  // A third of the default search's time.
  av_opt_set(context->priv_data, "aac_coder", "fast", 0);
  return context;
}

Frame makeFrame(const AVCodecContext& context) {
  Frame frame(av_frame_alloc());
  frame->format = context.sample_fmt;
  frame->sample_rate = context.sample_rate;
  frame->nb_samples = kFramesPerPacket;
  av_channel_layout_copy(&frame->ch_layout, &context.ch_layout);
  return av_frame_get_buffer(frame.get(), 0) == 0 ? std::move(frame) : nullptr;
}

}  // namespace

Result<std::unique_ptr<AACEncoder>> AACEncoder::open(const AudioSettings& settings) {
  const AVCodec* codec = avcodec_find_encoder_by_name("aac");
  if (codec == nullptr) return encoderError(AVERROR_ENCODER_NOT_FOUND);
  CodecContext context = makeContext(codec, settings);
  const int opened = avcodec_open2(context.get(), codec, nullptr);
  if (opened < 0) return encoderError(opened);
  Frame frame = makeFrame(*context);
  if (!frame || context->frame_size != kFramesPerPacket) return encoderError(AVERROR(ENOMEM));
  return std::unique_ptr<AACEncoder>(new AACEncoder(std::move(context), std::move(frame)));
}

AACEncoder::AACEncoder(CodecContext context, Frame frame)
    : context_(std::move(context)), frame_(std::move(frame)), packet_(av_packet_alloc()) {}

mp4::MovieTrack AACEncoder::track(uint32_t trackID) const {
  mp4::MovieTrack track;
  track.trackID = trackID;
  track.kind = mp4::MovieTrack::Kind::Audio;
  track.timescale = static_cast<uint32_t>(context_->sample_rate);
  track.mediaStart = context_->initial_padding;
  track.sampleEntry = mp4::makeAACSampleEntry(track.timescale, 2, static_cast<uint32_t>(context_->bit_rate),
                                              {context_->extradata, static_cast<size_t>(context_->extradata_size)});
  return track;
}

std::optional<Error> AACEncoder::append(const float* left, const float* right, int64_t count,
                                        std::vector<mp4::EncodedSample>& out) {
  framesTaken_ += count;
  return fill(left, right, count, out);
}

std::optional<Error> AACEncoder::fill(const float* left, const float* right, int64_t count,
                                      std::vector<mp4::EncodedSample>& out) {
  const float* const sources[2] = {left, right};
  int64_t done = 0;
  while (done < count) {
    if (filled_ == 0) {
      if (const int writable = av_frame_make_writable(frame_.get()); writable < 0) return encoderError(writable);
    }
    const int step = static_cast<int>(std::min<int64_t>(count - done, kFramesPerPacket - filled_));
    for (int channel = 0; channel < 2; ++channel) {
      float* to = reinterpret_cast<float*>(frame_->extended_data[channel]) + filled_;
      const float* from = sources[channel];
      from ? (void)std::copy_n(from + done, step, to) : (void)std::fill_n(to, step, 0.0f);
    }
    filled_ += step;
    done += step;
    if (filled_ < kFramesPerPacket) continue;
    if (auto error = submit(out)) return error;
  }
  return std::nullopt;
}

std::optional<Error> AACEncoder::appendSilence(int64_t count, std::vector<mp4::EncodedSample>& out) {
  framesTaken_ += count;
  const int64_t settling = kFramesPerPacket - filled_ + int64_t{kSettlingPackets} * kFramesPerPacket;
  if (count > settling + kFramesPerPacket) {
    if (auto error = fill(nullptr, nullptr, settling, out)) return error;
    count -= settling;
    for (; count >= kFramesPerPacket; count -= kFramesPerPacket) emit(lastPacket_, out);
  }
  return fill(nullptr, nullptr, count, out);
}

std::optional<Error> AACEncoder::flush(std::vector<mp4::EncodedSample>& out) {
  if (filled_ > 0) {
    if (auto error = fill(nullptr, nullptr, kFramesPerPacket - filled_, out)) return error;
  }
  return send(nullptr, out);
}

bool AACEncoder::isBlockSilent() const {
  for (int channel = 0; channel < 2; ++channel) {
    const auto* samples = reinterpret_cast<const float*>(frame_->extended_data[channel]);
    if (!std::all_of(samples, samples + kFramesPerPacket, [](float sample) { return sample == 0; })) return false;
  }
  return true;
}

/// A muted microphone, a game between two sounds: silence that goes on is not encoded again and again.
std::optional<Error> AACEncoder::submit(std::vector<mp4::EncodedSample>& out) {
  filled_ = 0;
  silentBlocks_ = isBlockSilent() ? silentBlocks_ + 1 : 0;
  if (silentBlocks_ > kSettlingPackets) {
    emit(lastPacket_, out);
    return std::nullopt;
  }
  frame_->pts = submitted_++ * kFramesPerPacket;
  return send(frame_.get(), out);
}

std::optional<Error> AACEncoder::send(const AVFrame* frame, std::vector<mp4::EncodedSample>& out) {
  const int sent = avcodec_send_frame(context_.get(), frame);
  if (sent < 0) return encoderError(sent);
  while (avcodec_receive_packet(context_.get(), packet_.get()) == 0) {
    emit({packet_->data, packet_->data + packet_->size}, out);
    av_packet_unref(packet_.get());
  }
  return std::nullopt;
}

void AACEncoder::emit(std::vector<uint8_t> data, std::vector<mp4::EncodedSample>& out) {
  lastPacket_ = data;
  mp4::EncodedSample sample;
  sample.data = std::move(data);
  sample.decodeTime = packets_++ * kFramesPerPacket;
  sample.duration = kFramesPerPacket;
  out.push_back(std::move(sample));
}

}  // namespace qv::platform::ffmpeg
