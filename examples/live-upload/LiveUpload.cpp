#include "LiveUpload.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace upload {

namespace {

constexpr int kMostWaitingFrames = 2;
constexpr size_t kMostInputs = 256;  // some seconds of sound
/// The stream's first time: the sound encoder's lead-in lies before the first sound.
constexpr int64_t kStreamStart = 100'000;  // microseconds

std::chrono::nanoseconds now() { return std::chrono::steady_clock::now().time_since_epoch(); }

CodecParameters parametersOf(const AVCodecContext& context) {
  CodecParameters parameters(avcodec_parameters_alloc());
  avcodec_parameters_from_context(parameters.get(), &context);
  return parameters;
}

quorvel::Value number(uint64_t count) { return {static_cast<int64_t>(count)}; }

}  // namespace

LiveUpload::LiveUpload(quorvel::Broadcast& broadcast) : broadcast_(broadcast) { avformat_network_init(); }

LiveUpload::~LiveUpload() {
  stopEncoding();
  sender_.reset();
}

// From the library ------------------------------------------------------------------------------------

void LiveUpload::started(quorvel::Dictionary userInfo) {
  settings_ = Settings::fromUserInfo(userInfo);
  if (settings_.format() == nullptr) return fail("The user information has no \"url\" that can be sent to.");
  if (!encoder_.joinable()) encoder_ = std::thread([this] { encodeInputs(); });
}

void LiveUpload::finished() {
  stopEncoding();
  if (sender_) sender_->finish();
}

void LiveUpload::processVideo(quorvel::VideoFrame frame, quorvel::Orientation orientation) {
  ++receivedFrames_;
  enqueue({Picture{std::move(frame), orientation}, now()});
}

void LiveUpload::processAudio(quorvel::AudioSample sample) { enqueue({std::move(sample), now()}); }

void LiveUpload::enqueue(Input input) {
  {
    std::lock_guard lock(mutex_);
    if (isEnding_ || hasFailed_ || inputs_.size() >= kMostInputs) return;
    const auto isFrame = [](const Input& i) { return std::holds_alternative<Picture>(i.sample); };
    if (isFrame(input) && ++waitingFrames_ > kMostWaitingFrames) {
      inputs_.erase(std::find_if(inputs_.begin(), inputs_.end(), isFrame));
      --waitingFrames_;
      ++droppedFrames_;
    }
    inputs_.push_back(std::move(input));
  }
  changed_.notify_all();
}

void LiveUpload::stopEncoding() {
  {
    std::lock_guard lock(mutex_);
    isEnding_ = true;
  }
  changed_.notify_all();
  if (encoder_.joinable()) encoder_.join();
}

// The encoder's thread --------------------------------------------------------------------------------

/// Ends when all that came before the end has been encoded.
void LiveUpload::encodeInputs() {
  for (;;) {
    Input input;
    {
      std::unique_lock lock(mutex_);
      changed_.wait(lock, [this] { return isEnding_ || !inputs_.empty(); });
      if (inputs_.empty()) return;
      input = std::move(inputs_.front());
      inputs_.pop_front();
      if (std::holds_alternative<Picture>(input.sample)) --waitingFrames_;
    }
    if (hasFailed_) continue;
    if (const auto* picture = std::get_if<Picture>(&input.sample)) {
      encode(*picture, input.received);
    } else if (const auto* sound = std::get_if<quorvel::AudioSample>(&input.sample); sound && origin_) {
      mixer_.add(*sound, streamTime(sound->presentationTime));
    }
    if (origin_ && !hasFailed_) encodeSound();
  }
}

int64_t LiveUpload::streamTime(quorvel::SampleTime time) const {
  return kStreamStart + std::chrono::duration_cast<std::chrono::microseconds>(time - *origin_).count();
}

/// The first picture begins the stream and settles its size: the upright one.
bool LiveUpload::open(const Picture& first) {
  const AVOutputFormat* format = av_guess_format(settings_.format(), nullptr, nullptr);
  const bool hasGlobalHeader = format != nullptr && (format->flags & AVFMT_GLOBALHEADER) != 0;
  const PictureSize size{static_cast<int>(first.frame.width), static_cast<int>(first.frame.height)};
  pictures_ = PictureEncoder::open(settings_, uprightSize(size, first.orientation), hasGlobalHeader);
  sounds_ = SoundEncoder::open(settings_.audioBitRate, hasGlobalHeader);
  if (!pictures_ || !sounds_) {
    fail("This device has no encoder for H.264 and AAC.");
    return false;
  }
  sender_ = std::make_unique<StreamSender>(
      settings_, StreamParameters{parametersOf(pictures_->context()), parametersOf(sounds_->context())},
      [this](const StreamSender::Report& state) { report(state); });
  origin_ = first.frame.presentationTime;
  return true;
}

void LiveUpload::encode(const Picture& picture, std::chrono::nanoseconds received) {
  if (!origin_ && !open(picture)) return;
  const quorvel::VideoFrame& frame = picture.frame;
  const int64_t time = streamTime(frame.presentationTime);
  mixer_.notePicture(time);
  if (!hasPaused_) {
    deliverySum_ += std::chrono::duration<double, std::milli>(received - frame.presentationTime).count();
    delivery_ = deliverySum_ / static_cast<double>(++deliveryCount_);
  }
  // Pictures beyond the chosen rate are left out; a quarter of the interval early is still its turn.
  const int64_t interval = 1'000'000 / settings_.frameRate;
  if (time <= lastPicture_ || time < nextPicture_ - interval / 4) {
    ++skippedFrames_;
    return;
  }
  nextPicture_ = std::max(nextPicture_ + interval, time + interval / 2);
  lastPicture_ = time;
  pictures_->encode(frame, picture.orientation, time, sender_->takeKeyFrameWish(),
                    [&](Packet packet) { sender_->sendVideo(std::move(packet), received); });
}

void LiveUpload::encodeSound() {
  while (const auto chunk = mixer_.take())
    sounds_->encode(*chunk, [this](Packet packet) { sender_->sendAudio(std::move(packet)); });
}

// To the application ----------------------------------------------------------------------------------

void LiveUpload::report(const StreamSender::Report& report) {
  if (report.state == StreamSender::State::Failed)
    return fail("The stream cannot be sent to the server: " + report.error);
  if (report.state == StreamSender::State::Live && !settings_.playbackURL.empty() && !hasToldURL_.exchange(true))
    broadcast_.updateBroadcastURL(settings_.playbackURL);
  broadcast_.updateServiceInfo({{"state", {std::string(nameOf(report.state))}},
                                {"receivedFrames", number(receivedFrames_)},
                                {"skippedFrames", number(skippedFrames_)},
                                {"sentFrames", number(report.sentFrames)},
                                {"droppedFrames", number(droppedFrames_ + report.droppedFrames)},
                                {"connections", number(report.connections)},
                                {"deliveryMilliseconds", {delivery_.load()}},
                                {"latencyMilliseconds", {report.latencyMilliseconds}},
                                {"error", {report.error}}});
}

void LiveUpload::fail(const std::string& text) {
  if (hasFailed_.exchange(true)) return;
  std::fprintf(stderr, "live-upload: %s\n", text.c_str());
  broadcast_.finishBroadcastWithError({quorvel::kErrorInvalidBroadcastSession, "", text});
}

}  // namespace upload
