#pragma once

#include <quorvel/BroadcastExtension.h>

#include <atomic>
#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <thread>
#include <variant>

#include "PictureEncoder.h"
#include "SoundEncoder.h"
#include "SoundMixer.h"
#include "StreamSender.h"

namespace upload {

/// Sends a broadcast to a streaming server as H.264 and AAC.
///
/// The library's calls only put samples into a short queue; a thread encodes them, and the sender's thread waits for
/// the network. Pictures that come faster than they are encoded are dropped, the oldest first: two wait at the most.
class LiveUpload final : public quorvel::SampleExtension {
 public:
  explicit LiveUpload(quorvel::Broadcast& broadcast);
  ~LiveUpload() override;
  void started(quorvel::Dictionary userInfo) override;
  void paused() override { hasPaused_ = true; }
  void finished() override;
  void processVideo(quorvel::VideoFrame frame, quorvel::Orientation orientation) override;
  void processAudio(quorvel::AudioSample sample) override;

 private:
  struct Picture {
    quorvel::VideoFrame frame;
    quorvel::Orientation orientation;
  };
  using Sample = std::variant<Picture, quorvel::AudioSample>;
  struct Input {
    Sample sample;
    std::chrono::nanoseconds received;
  };
  void enqueue(Input input);
  void stopEncoding();
  void encodeInputs();
  void encode(const Picture& picture, std::chrono::nanoseconds received);
  void encodeSound();
  [[nodiscard]] bool open(const Picture& first);
  [[nodiscard]] int64_t streamTime(quorvel::SampleTime time) const;
  void report(const StreamSender::Report& report);
  void fail(const std::string& text);

  quorvel::Broadcast& broadcast_;
  Settings settings_;

  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Input> inputs_;
  int waitingFrames_ = 0;
  bool isEnding_ = false;
  std::atomic<uint64_t> receivedFrames_ = 0, skippedFrames_ = 0, droppedFrames_ = 0;

  // The encoder's thread only.
  std::optional<quorvel::SampleTime> origin_;
  int64_t lastPicture_ = -1, nextPicture_ = 0;
  std::unique_ptr<PictureEncoder> pictures_;
  std::unique_ptr<SoundEncoder> sounds_;
  SoundMixer mixer_;
  std::unique_ptr<StreamSender> sender_;
  double deliverySum_ = 0;
  uint64_t deliveryCount_ = 0;
  std::atomic<double> delivery_ = 0;     // milliseconds from capture to here, mean
  std::atomic<bool> hasPaused_ = false;  // then a picture's time no longer tells when it was captured
  std::atomic<bool> hasFailed_ = false;
  std::atomic<bool> hasToldURL_ = false;

  std::thread encoder_;
};

}  // namespace upload
