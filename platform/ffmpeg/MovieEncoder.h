#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <vector>

#include "platform/ffmpeg/AudioTrackEncoder.h"
#include "platform/ffmpeg/RecordingTimeline.h"
#include "platform/ffmpeg/VideoEncoder.h"
#include "platform/ffmpeg/VideoEncoderChoice.h"
#include "platform/ffmpeg/WriterState.h"
#include "platform/mp4/MovieRecorder.h"

namespace qv::platform::ffmpeg {

/// One input, as the encoder thread needs it.
struct TrackPlan {
  MediaType type = MediaType::Video;
  Dictionary settings;
  AffineTransform transform;
};

/// Turns the samples of one movie into its file: the encoder thread's side of a writer.
///
/// Threading: made and used on the encoder thread.
class MovieEncoder {
 public:
  MovieEncoder(std::shared_ptr<WriterState> state, std::unique_ptr<mp4::MovieFile> file,
               const std::vector<TrackPlan>& plans, VideoEncoderChoice& videoEncoders);
  /// Deals with items until the movie is finished or the writer goes away.
  void run();

 private:
  /// An input's encoder; exactly one of the two.
  struct Track {
    std::unique_ptr<VideoEncoder> video;
    std::unique_ptr<AudioTrackEncoder> audio;
    AffineTransform transform;
  };
  std::optional<Error> open(const std::vector<TrackPlan>& plans, VideoEncoderChoice& videoEncoders);
  /// Begins the file. Its header waits for the first picture, which tells how pictures lie in their track.
  void beginFile();
  /// False after the finish.
  bool handle(WriterItem item);
  void handleSample(const QueuedSample& queued);
  std::optional<Error> handlePicture(size_t track, const SampleBuffer& sample);
  void observe(MediaTime captureTime, MediaTime presentationTime);
  void advanceAudio();
  void finish(SessionFinish request);
  mp4::MovieEnd finishTracks(const std::optional<MediaTime>& endTime);
  void placeRestOfSound(std::optional<int64_t> endTick);
  /// In mp4::kMovieTimescale; nothing where the movie is to end with its last sample.
  [[nodiscard]] std::optional<int64_t> endTick(const std::optional<MediaTime>& endTime) const;
  [[nodiscard]] mp4::MovieEnd movieEnd(std::optional<int64_t> endTick) const;
  [[nodiscard]] int64_t tickOf(MediaTime presentationTime) const;
  void check(const std::optional<Error>& error);
  /// The movie up to here is finished and kept.
  void endWith(const Error& error);
  void write(size_t track, std::vector<mp4::EncodedSample>& samples);

  const std::shared_ptr<WriterState> state_;
  std::unique_ptr<mp4::MovieFile> file_;  // until the recorder has it
  std::vector<Track> tracks_;
  std::unique_ptr<mp4::MovieRecorder> recorder_;
  RecordingTimeline timeline_;
  std::optional<MediaTime> sessionStart_;
  std::optional<int64_t> firstTick_;  ///< of a picture, as the next
  std::optional<int64_t> lastTick_;
  int64_t lastInterval_ = 0;
  int64_t expectedInterval_ = mp4::kMovieTimescale / 60;
  uint64_t pictures_ = 0;
  bool isFileEnded_ = false;
};

}  // namespace qv::platform::ffmpeg
