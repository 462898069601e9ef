#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace qv::platform::test {

/// What independent readers (ffprobe and ffmpeg, as programs) say of a movie.
struct ProbedTrack {
  std::string type;
  std::string codec;
  std::string profile;
  double duration = 0;
  double startTime = 0;
  int width = 0;
  int height = 0;
  double rotation = 0;
};
struct ProbedMovie {
  /// Of the whole file read and decoded, and of a second reader (mediainfo) about its tracks and
  /// durations; empty for a good movie.
  std::string errors;
  double duration = 0;
  std::vector<ProbedTrack> tracks;
};
ProbedMovie probe(const std::string& path);
/// Fails the test where a reader complains.
ProbedMovie probeGood(const std::string& path);

struct DecodedPicture {
  double time;
  uint32_t number;
  bool isKey;
};
enum class Turning { AsCoded, AsShown };
/// Every picture that is shown, its number read off the decoded pixels.
std::vector<DecodedPicture> decodePictures(const std::string& path, Turning turning = Turning::AsCoded);
/// Expects that many pictures with numbers from `first` on, at times from 0 on.
void expectPictures(const std::string& path, uint32_t first, uint32_t count, double rate,
                    Turning turning = Turning::AsCoded);
/// Expects sound that begins at these times, on a millisecond.
void expectBeeps(const std::string& path, int track, const std::vector<double>& times);
struct PicturePacket {
  double time;
  size_t size;    ///< bytes
  size_t offset;  ///< in the file
  bool isKey;
};
std::vector<PicturePacket> packetsOfPictures(const std::string& path);
/// The sound of the n-th audio track as shown, its left side, in samples of that rate.
std::vector<float> decodeSound(const std::string& path, int track, int rate = 44100);
/// Where each beep begins, in seconds.
std::vector<double> beeps(const std::vector<float>& sound, int rate = 44100);

std::string run(const std::string& command);

}  // namespace qv::platform::test
