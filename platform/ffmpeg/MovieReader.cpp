#include "platform/ffmpeg/MovieReader.h"

#include <cstdlib>
#include <limits>

#include "platform/mp4/MovieTrack.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

int isCancelled(void* flag) { return static_cast<const std::atomic<bool>*>(flag)->load() ? 1 : 0; }

Error unreadable(const std::string& what) { return mp4::movieError(mp4::kMovieNotReadable, "movie: " + what); }

/// Far beyond any movie, and small enough to be reckoned with.
constexpr int64_t kLatestTime = int64_t{1} << 52;

bool hasPlausibleTimes(const AVPacket& packet) {
  const auto isPlausible = [](int64_t time) {
    return time == AV_NOPTS_VALUE || (time > -kLatestTime && time < kLatestTime);
  };
  if (!isPlausible(packet.pts) || !isPlausible(packet.dts)) return false;
  if (packet.duration < 0 || packet.duration > std::numeric_limits<uint32_t>::max()) return false;
  if (packet.pts == AV_NOPTS_VALUE || packet.dts == AV_NOPTS_VALUE) return true;
  return std::abs(packet.pts - packet.dts) <= std::numeric_limits<int32_t>::max();
}

}  // namespace

Result<std::unique_ptr<MovieReader>> MovieReader::open(const std::string& path, const std::atomic<bool>* cancelled) {
  AVFormatContext* context = avformat_alloc_context();
  if (cancelled) context->interrupt_callback = {isCancelled, const_cast<std::atomic<bool>*>(cancelled)};
  // The name is a file's, never a protocol's; and its content is a movie's, never a playlist's, which names others.
  const int opened = avformat_open_input(&context, ("file:" + path).c_str(), av_find_input_format("mp4"), nullptr);
  if (opened < 0) return unreadable(errorText(opened));
  std::unique_ptr<MovieReader> reader(new MovieReader(std::unique_ptr<AVFormatContext, FormatDeleter>(context)));
  const int found = avformat_find_stream_info(context, nullptr);
  if (found < 0) return unreadable(errorText(found));
  if (reader->streams(AVMEDIA_TYPE_VIDEO).empty() && reader->streams(AVMEDIA_TYPE_AUDIO).empty()) {
    return unreadable("no tracks");
  }
  if (reader->duration() <= 0) return unreadable("no duration");
  return reader;
}

std::vector<AVStream*> MovieReader::streams(AVMediaType type) const {
  std::vector<AVStream*> found;
  for (unsigned i = 0; i < context_->nb_streams; ++i) {
    if (context_->streams[i]->codecpar->codec_type == type) found.push_back(context_->streams[i]);
  }
  return found;
}

int64_t MovieReader::duration() const {
  if (context_->duration == AV_NOPTS_VALUE) return 0;
  return av_rescale(context_->duration, mp4::kMovieTimescale, AV_TIME_BASE);
}

void MovieReader::seek(int64_t tick) {
  const auto videos = streams(AVMEDIA_TYPE_VIDEO);
  const AVStream* stream = videos.empty() ? context_->streams[0] : videos.front();
  const AVRational ticks = {1, static_cast<int>(mp4::kMovieTimescale)};
  const int64_t time = av_rescale_q(tick, ticks, stream->time_base);
  const int sought = avformat_seek_file(context_.get(), stream->index, INT64_MIN, time, time, 0);
  // Nothing before that time: then from the beginning, where the reader already is.
  if (sought < 0) (void)avformat_seek_file(context_.get(), -1, INT64_MIN, INT64_MIN + 1, INT64_MAX, 0);
}

Result<bool> MovieReader::read(AVPacket& packet) {
  const int got = av_read_frame(context_.get(), &packet);
  if (got == AVERROR_EOF) return false;
  if (got < 0) return unreadable(errorText(got));
  if ((packet.flags & AV_PKT_FLAG_CORRUPT) != 0) return unreadable("damaged media");
  if (!hasPlausibleTimes(packet)) return unreadable("impossible times");
  return true;
}

}  // namespace qv::platform::ffmpeg
