#include "StreamConnection.h"

#include <algorithm>
#include <cstdlib>
#include <thread>
#include <utility>

#include "LibraryLog.h"
#include "PictureEncoder.h"

namespace upload {

namespace {

using namespace std::chrono_literals;

constexpr auto kLongestConnecting = 10s, kLongestWrite = 5s;
constexpr int64_t kInterleaving = 500'000;  // microseconds
/// Seven packets of a transport stream, the most that an Ethernet frame holds whole.
constexpr const char kDatagram[] = "1316";  // bytes
/// How far a transport stream's clock runs behind its pictures and sound: what a receiver has to wait.
constexpr int kClockDelay = 200'000;  // microseconds
/// A broken SRT connection takes with it what the receiver still delays; without a latency in the URL, 120 ms.
constexpr int64_t kSRTLatency = 120'000, kLongestSRTLatency = 2'000'000;  // microseconds
constexpr auto kSRTMargin = 100ms;

/// By the URL's query.
std::chrono::microseconds latencyOfSRT(const std::string& url) {
  const size_t at = url.find("latency=");
  const int64_t asked = at == std::string::npos ? 0 : std::strtoll(url.c_str() + at + 8, nullptr, 10);
  return std::chrono::microseconds(std::clamp(asked, kSRTLatency, kLongestSRTLatency));
}

/// Options for every protocol and container: each takes its own.
AVDictionary* makeOptions(const Settings& settings) {
  AVDictionary* options = nullptr;
  if (settings.scheme() == "udp") av_dict_set(&options, "pkt_size", kDatagram, 0);
  // Off in libavformat. The stream's key is not to be sent to whoever answers.
  if (settings.scheme() == "rtmps") av_dict_set(&options, "tls_verify", "1", 0);
  // Sound not gathered into larger pieces, which would come after its time.
  av_dict_set(&options, "pes_payload_size", "0", 0);
  av_dict_set(&options, "flvflags", "no_duration_filesize", 0);
  return options;
}

/// Of connecting. A server that says no over RTMP is EPERM.
bool isDefinite(int code, const std::string& cause) {
  constexpr int kDefinite[] = {AVERROR(EINVAL), AVERROR(EPERM), AVERROR(EACCES), AVERROR_PROTOCOL_NOT_FOUND,
                               AVERROR_OPTION_NOT_FOUND};
  // There is no code for a certificate; with other words we would try again for a while.
  return std::find(std::begin(kDefinite), std::end(kDefinite), code) != std::end(kDefinite) ||
         cause.find("certificate") != std::string::npos;
}

}  // namespace

StreamConnection::StreamConnection(const Settings& settings, const StreamParameters& parameters,
                                   std::function<bool()> isCancelled)
    : settings_(settings), parameters_(parameters), isCancelled_(std::move(isCancelled)) {}

StreamConnection::~StreamConnection() {
  if (stream_ == nullptr) return;
  deadline_ = Clock::now();
  const LibraryLog unheard;
  avio_closep(&stream_->pb);
  avformat_free_context(stream_);
}

int StreamConnection::isInterrupted(void* connection) {
  const auto& self = *static_cast<StreamConnection*>(connection);
  return Clock::now() >= self.deadline_ || self.isCancelled_() ? 1 : 0;
}

bool StreamConnection::addStream(const AVCodecParameters& codec) {
  AVStream* stream = avformat_new_stream(stream_, nullptr);
  if (stream == nullptr || avcodec_parameters_copy(stream->codecpar, &codec) < 0) return false;
  stream->time_base = kMicroseconds;
  return true;
}

int StreamConnection::connect() {
  const int made = avformat_alloc_output_context2(&stream_, nullptr, settings_.format(), settings_.url.c_str());
  if (made < 0) return made;
  stream_->interrupt_callback = {&StreamConnection::isInterrupted, this};
  stream_->max_interleave_delta = kInterleaving;
  stream_->max_delay = kClockDelay;
  stream_->flags |= AVFMT_FLAG_FLUSH_PACKETS;
  if (!addStream(*parameters_.video) || !addStream(*parameters_.audio)) return AVERROR(ENOMEM);
  AVDictionary* options = makeOptions(settings_);
  int result = avio_open2(&stream_->pb, settings_.url.c_str(), AVIO_FLAG_WRITE, &stream_->interrupt_callback, &options);
  if (result >= 0) result = avformat_write_header(stream_, &options);
  av_dict_free(&options);
  return result;
}

std::optional<StreamConnection::Failure> StreamConnection::open() {
  deadline_ = Clock::now() + kLongestConnecting;
  const LibraryLog log;
  const int result = connect();
  if (result >= 0) return std::nullopt;
  Failure found = failure(result, log.firstError());
  found.isDefinite = isDefinite(result, log.firstError());
  return found;
}

std::optional<StreamConnection::Failure> StreamConnection::write(Packet packet, Stream stream) {
  deadline_ = Clock::now() + kLongestWrite;
  const LibraryLog log;
  packet->stream_index = stream;
  av_packet_rescale_ts(packet.get(), kMicroseconds, stream_->streams[stream]->time_base);
  const int result = av_interleaved_write_frame(stream_, packet.get());
  if (result >= 0) return std::nullopt;
  Failure found = failure(result, log.firstError());
  found.text.insert(0, "The connection was lost: ");
  return found;
}

void StreamConnection::finish() {
  deadline_ = Clock::now() + kLongestWrite;
  const LibraryLog unheard;
  av_write_trailer(stream_);
  if (settings_.scheme() == "srt") std::this_thread::sleep_for(latencyOfSRT(settings_.url) + kSRTMargin);
  avio_closep(&stream_->pb);
}

StreamConnection::Failure StreamConnection::failure(int code, std::string cause) const {
  const std::string shown = settings_.url.substr(0, settings_.url.find('?'));
  for (size_t at = 0; (at = cause.find(settings_.url, at)) != std::string::npos; at += shown.size())
    cause.replace(at, settings_.url.size(), shown);
  const std::string text = Clock::now() >= deadline_               ? "the server does not answer"
                           : code == AVERROR(EIO) && cause.empty() ? "the server hung up"
                                                                   : errorText(code);
  if (cause.empty()) return {text};
  return {cause.find(text) != std::string::npos ? cause : cause + " (" + text + ")"};
}

}  // namespace upload
