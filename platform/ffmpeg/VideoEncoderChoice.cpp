#include "platform/ffmpeg/VideoEncoderChoice.h"

#include <glob.h>

#include <condition_variable>
#include <mutex>

#include "platform/threads/Executor.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {
namespace {

using Clock = std::chrono::steady_clock;

/// A size that every encoder takes and every recording resembles.
constexpr VideoSettings kTrialSettings{1280, 720, 3'000'000, 60, 60};

/// One candidate at one device.
struct Attempt {
  H264Codec codec;
  std::string node;
  [[nodiscard]] std::string name() const { return node.empty() ? codec.name : codec.name + " (" + node + ")"; }
};

std::vector<std::string> nodesOf(const H264Codec& codec) {
  if (codec.nodes.empty()) return {""};
  std::vector<std::string> nodes;
  glob_t found{};
  if (::glob(codec.nodes.c_str(), 0, nullptr, &found) == 0) {
    nodes.assign(found.gl_pathv, found.gl_pathv + found.gl_pathc);
  }
  ::globfree(&found);
  if (!codec.oneNodeEach && !nodes.empty()) return {""};
  return nodes;
}

std::string reasonOf(const Error& error) {
  return valueForKey(error.userInfo, kLocalizedDescriptionKey).asString(error.description());
}

void addReason(std::string& reasons, const std::string& name, const std::string& why) {
  reasons += "; " + name + ": " + why;
}

}  // namespace

struct VideoEncoderChoice::State {
  std::vector<H264Codec> candidates;
  std::chrono::milliseconds patience{0};
  std::once_flag begun;
  std::mutex mutex;
  std::condition_variable changed;
  /// Made before `begun` is done, constant from then on.
  std::vector<Attempt> attempts;
  std::string reasons;
  std::optional<size_t> chosen;  ///< guarded by `mutex`

  void listAttempts();
  void tryAll();
  void choose(size_t index, Clock::duration took);
  [[nodiscard]] size_t waitForChoice();
};

void VideoEncoderChoice::State::listAttempts() {
  for (const H264Codec& codec : candidates) {
    const auto nodes = nodesOf(codec);
    if (nodes.empty()) addReason(reasons, codec.name, "no " + codec.nodes);
    for (const std::string& node : nodes) attempts.push_back({codec, node});
  }
}

void VideoEncoderChoice::State::tryAll() {
  const auto began = Clock::now();
  size_t index = 0;
  for (; index + 1 < attempts.size(); ++index) {
    const Attempt& attempt = attempts[index];
    const auto failure = VideoEncoder::tryOut(attempt.codec, attempt.node, kTrialSettings);
    if (!failure) break;
    addReason(reasons, attempt.name(), reasonOf(*failure));
  }
  choose(index, Clock::now() - began);
}

void VideoEncoderChoice::State::choose(size_t index, Clock::duration took) {
  const auto milliseconds = std::chrono::duration_cast<std::chrono::milliseconds>(took).count();
  QV_LOG(logs::kMovie, "H.264 encoder: %s, chosen in %lld ms%s", attempts[index].name().c_str(),
         static_cast<long long>(milliseconds), reasons.c_str());
  {
    std::lock_guard lock(mutex);
    chosen = index;
  }
  changed.notify_all();
}

size_t VideoEncoderChoice::State::waitForChoice() {
  std::unique_lock lock(mutex);
  if (changed.wait_for(lock, patience, [this] { return chosen.has_value(); })) return *chosen;
  QV_LOG(logs::kMovie, "H.264 encoders are still being tried, taking %s", attempts.back().name().c_str());
  return attempts.size() - 1;
}

VideoEncoderChoice::VideoEncoderChoice(std::vector<H264Codec> candidates, std::chrono::milliseconds patience)
    : state_(std::make_shared<State>()) {
  state_->candidates = std::move(candidates);
  state_->patience = patience;
}

void VideoEncoderChoice::prepare() {
  std::call_once(state_->begun, [this] {
    state_->listAttempts();
    if (state_->attempts.size() == 1) return state_->choose(0, {});
    globalQueue().post([state = state_] { state->tryAll(); });
  });
}

Result<std::unique_ptr<VideoEncoder>> VideoEncoderChoice::open(const VideoSettings& settings) {
  prepare();
  for (size_t index = state_->waitForChoice();; ++index) {
    const Attempt& attempt = state_->attempts[index];
    auto encoder = VideoEncoder::open(attempt.codec, attempt.node, settings);
    if (encoder || index + 1 == state_->attempts.size()) return encoder;
    QV_LOG(logs::kMovie, "%s refuses %dx%d at %lld bit/s: %s", attempt.name().c_str(), settings.width, settings.height,
           static_cast<long long>(settings.bitRate), reasonOf(encoder.error()).c_str());
  }
}

}  // namespace qv::platform::ffmpeg
