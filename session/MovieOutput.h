#pragma once

#include <memory>
#include <mutex>
#include <string>

#include "session/RecordingOutput.h"
#include "session/RecordingSettings.h"
#include "writer/QVMovieWriter.h"

namespace qv {

/// Records into one movie of the temporary store.
///
/// Threading: as its contract says.
class MovieOutput final : public RecordingOutput, public std::enable_shared_from_this<MovieOutput> {
 public:
  struct Movie {
    std::string path;     ///< where it is to be; another path where that one is somebody else's
    std::string owner;    ///< whose it is
    platform::Size size;  ///< of the pictures as they are coded
    bool systemRecording = false;
  };
  MovieOutput(std::shared_ptr<RecordingContext> context, Movie movie);

  void prepare(ReadyHandler handler) override;
  void start(ReadyHandler handler) override;
  [[nodiscard]] bool appendVideo(const PlacedPicture& picture) override;
  void appendAppAudio(const PlacedSound& sound) override;
  void appendMicrophone(const PlacedSound& sound) override;
  void finish(platform::MediaTime endTime, FinishHandler handler) override;
  [[nodiscard]] bool makesMovie() const override { return true; }
  [[nodiscard]] std::string moviePath() const override;
  [[nodiscard]] std::optional<platform::Error> failure() const override;
  [[nodiscard]] OutputCounts counts() const override;
  void notifyRecordingMayBeStopped() override;
  void notifyRecordingResumed() override;

 private:
  [[nodiscard]] std::shared_ptr<MovieClaim> claim() const;
  [[nodiscard]] std::shared_ptr<QVMovieWriter> writer() const;

  const std::shared_ptr<RecordingContext> context_;
  const Movie movie_;
  mutable std::mutex mutex_;
  std::shared_ptr<MovieClaim> claim_;
  std::shared_ptr<QVMovieWriter> writer_;
};

}  // namespace qv
