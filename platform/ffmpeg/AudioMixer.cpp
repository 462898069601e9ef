#include "platform/ffmpeg/AudioMixer.h"

#include <algorithm>
#include <cstdio>

#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

constexpr AudioSettings kMixSettings = {44100, 192000};

Error mixError(const char* what, int code) {
  return mp4::movieError(mp4::kMovieNotReadable, std::string("audio mix: ") + what + ": " + errorText(code));
}

/// What a stream's sound passes before the mix: a fixed rate with its gaps filled, its part of the range.
std::string chainOf(size_t input, const ExportRange& range) {
  char text[256];
  std::snprintf(text, sizeof text,
                "[in%zu]aresample=%d:async=1:first_pts=0,aformat=sample_fmts=fltp:channel_layouts=stereo,"
                "atrim=start_sample=%lld:end_sample=%lld,asetpts=PTS-STARTPTS[a%zu];",
                input, kMixSettings.sampleRate,
                static_cast<long long>(av_rescale(range.start, kMixSettings.sampleRate, mp4::kMovieTimescale)),
                static_cast<long long>(av_rescale(range.end, kMixSettings.sampleRate, mp4::kMovieTimescale)), input);
  return text;
}

std::string graphOf(size_t inputs, const ExportRange& range) {
  std::string text;
  for (size_t i = 0; i < inputs; ++i) text += chainOf(i, range);
  for (size_t i = 0; i < inputs; ++i) text += "[a" + std::to_string(i) + "]";
  return text + "amix=inputs=" + std::to_string(inputs) + ":duration=longest:normalize=0,aformat=sample_fmts=fltp:" +
         "channel_layouts=stereo:sample_rates=" + std::to_string(kMixSettings.sampleRate) + "[out]";
}

AVFilterInOut* endpoint(const char* name, AVFilterContext* context, AVFilterInOut* next) {
  AVFilterInOut* end = avfilter_inout_alloc();
  end->name = av_strdup(name);
  end->filter_ctx = context;
  end->next = next;
  return end;
}

}  // namespace

Result<std::unique_ptr<AudioMixer>> AudioMixer::create(const std::vector<AVStream*>& streams,
                                                       const ExportRange& range) {
  std::unique_ptr<AudioMixer> mixer(new AudioMixer);
  mixer->graph_.reset(avfilter_graph_alloc());
  mixer->graph_->nb_threads = 1;
  mixer->frame_.reset(av_frame_alloc());
  for (const AVStream* stream : streams) {
    if (auto error = mixer->addSource(*stream)) return *error;
  }
  if (auto error = mixer->buildGraph(range)) return *error;
  auto encoder = AACEncoder::open(kMixSettings);
  if (!encoder) return encoder.error();
  mixer->encoder_ = std::move(*encoder);
  mixer->rangeFrames_ = av_rescale(range.end - range.start, kMixSettings.sampleRate, mp4::kMovieTimescale);
  return mixer;
}

std::optional<Error> AudioMixer::addSource(const AVStream& stream) {
  const AVCodec* codec = avcodec_find_decoder(stream.codecpar->codec_id);
  if (codec == nullptr) return mixError("decoder", AVERROR_DECODER_NOT_FOUND);
  CodecContext decoder(avcodec_alloc_context3(codec));
  avcodec_parameters_to_context(decoder.get(), stream.codecpar);
  decoder->pkt_timebase = stream.time_base;
  decoder->thread_count = 1;
  if (const int opened = avcodec_open2(decoder.get(), codec, nullptr); opened < 0) return mixError("decoder", opened);
  if (decoder->ch_layout.order == AV_CHANNEL_ORDER_UNSPEC) {
    av_channel_layout_default(&decoder->ch_layout, decoder->ch_layout.nb_channels);
  }
  char layout[64] = {};
  av_channel_layout_describe(&decoder->ch_layout, layout, sizeof layout);
  char arguments[256];
  std::snprintf(arguments, sizeof arguments, "time_base=%d/%d:sample_rate=%d:sample_fmt=%s:channel_layout=%s",
                stream.time_base.num, stream.time_base.den, decoder->sample_rate,
                av_get_sample_fmt_name(decoder->sample_fmt), layout);
  AVFilterContext* entry = nullptr;
  const std::string name = "in" + std::to_string(sources_.size());
  const int made = avfilter_graph_create_filter(&entry, avfilter_get_by_name("abuffer"), name.c_str(), arguments,
                                                nullptr, graph_.get());
  if (made < 0) return mixError("source", made);
  sources_.push_back({stream.index, std::move(decoder), entry});
  return std::nullopt;
}

std::optional<Error> AudioMixer::buildGraph(const ExportRange& range) {
  const int made =
      avfilter_graph_create_filter(&mixed_, avfilter_get_by_name("abuffersink"), "out", nullptr, nullptr, graph_.get());
  if (made < 0) return mixError("sink", made);
  AVFilterInOut* entries = nullptr;
  for (size_t i = sources_.size(); i-- > 0;) {
    entries = endpoint(("in" + std::to_string(i)).c_str(), sources_[i].entry, entries);
  }
  AVFilterInOut* exit = endpoint("out", mixed_, nullptr);
  const std::string description = graphOf(sources_.size(), range);
  int built = avfilter_graph_parse_ptr(graph_.get(), description.c_str(), &exit, &entries, nullptr);
  avfilter_inout_free(&entries);
  avfilter_inout_free(&exit);
  if (built >= 0) built = avfilter_graph_config(graph_.get(), nullptr);
  if (built < 0) return mixError("graph", built);
  return std::nullopt;
}

std::optional<Error> AudioMixer::add(int stream, const AVPacket& packet, std::vector<mp4::EncodedSample>& out) {
  for (Source& source : sources_) {
    if (source.stream == stream) return decode(source, &packet, out);
  }
  return std::nullopt;
}

std::optional<Error> AudioMixer::decode(Source& source, const AVPacket* packet, std::vector<mp4::EncodedSample>& out) {
  const int sent = avcodec_send_packet(source.decoder.get(), packet);
  // One damaged packet is a click, not the end of the movie.
  if (sent < 0 && sent != AVERROR_INVALIDDATA && sent != AVERROR_EOF) return mixError("decoder", sent);
  while (avcodec_receive_frame(source.decoder.get(), frame_.get()) == 0) {
    const int taken = av_buffersrc_add_frame(source.entry, frame_.get());
    if (taken < 0) return mixError("source", taken);
  }
  if (packet == nullptr) {
    const int ended = av_buffersrc_add_frame(source.entry, nullptr);
    if (ended < 0) return mixError("source", ended);
  }
  return encodeMixed(out);
}

std::optional<Error> AudioMixer::encodeMixed(std::vector<mp4::EncodedSample>& out) {
  while (av_buffersink_get_frame(mixed_, frame_.get()) == 0) {
    float* sides[2] = {reinterpret_cast<float*>(frame_->extended_data[0]),
                       reinterpret_cast<float*>(frame_->extended_data[1])};
    const int64_t count = std::min<int64_t>(frame_->nb_samples, rangeFrames_ - encoder_->framesTaken());
    for (float* side : sides) {
      for (int64_t i = 0; i < count; ++i) side[i] = std::clamp(side[i], -1.0f, 1.0f);
    }
    auto error = count > 0 ? encoder_->append(sides[0], sides[1], count, out) : std::nullopt;
    av_frame_unref(frame_.get());
    if (error) return error;
  }
  return std::nullopt;
}

std::optional<Error> AudioMixer::finish(std::vector<mp4::EncodedSample>& out) {
  for (Source& source : sources_) {
    if (auto error = decode(source, nullptr, out)) return error;
  }
  const int64_t missing = rangeFrames_ - encoder_->framesTaken();
  if (missing > 0) {
    if (auto error = encoder_->appendSilence(missing, out)) return error;
  }
  return encoder_->flush(out);
}

}  // namespace qv::platform::ffmpeg
