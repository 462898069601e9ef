// How long the finish of a long movie takes: its index is written and synced, nothing is copied.
// Prints the movie's seconds and the finish's milliseconds, one length to a line.

#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "platform/mp4/MovieWriter.h"

using namespace qv::platform;
using namespace qv::platform::mp4;

namespace {

constexpr int kPicturesPerSecond = 60;
constexpr uint32_t kSoundRate = 44100, kPacketFrames = 1024;
/// The finish does not touch the media, so that small samples tell the same with less of the disk.
constexpr size_t kPictureBytes = 300, kPacketBytes = 40;

/// Leaves out the sync of each second while the movie is being made, which is not measured.
class ImpatientFile final : public MovieFile {
 public:
  ImpatientFile(std::unique_ptr<MovieFile> file, const bool& syncs) : file_(std::move(file)), syncs_(syncs) {}
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) override { return file_->writeAt(bytes, offset); }
  int truncate(uint64_t size) override { return file_->truncate(size); }
  int sync() override { return syncs_ ? file_->sync() : 0; }

 private:
  std::unique_ptr<MovieFile> file_;
  const bool& syncs_;
};

MovieTrack soundTrack(uint32_t trackID) {
  MovieTrack track;
  track.trackID = trackID;
  track.kind = MovieTrack::Kind::Audio;
  track.timescale = kSoundRate;
  track.sampleEntry = makeAACSampleEntry(kSoundRate, 2, 128000, std::vector<uint8_t>{0x12, 0x10});
  return track;
}

MovieTrack pictureTrack() {
  MovieTrack track;
  track.width = 1280;
  track.height = 720;
  track.sampleEntry = makeAVCSampleEntry(track.width, track.height, std::vector<uint8_t>(40, 1), ColorDescription{});
  return track;
}

void addSound(std::vector<EncodedSample>& samples, int64_t& packets, int second) {
  for (; packets * kPacketFrames < (int64_t{second} + 1) * kSoundRate; ++packets) {
    const auto bytes = kPacketBytes + static_cast<size_t>(packets % 7);
    samples.push_back({std::vector<uint8_t>(bytes), packets * kPacketFrames, 0, kPacketFrames, true});
  }
}

void require(const std::optional<Error>& error) {
  if (!error) return;
  std::fprintf(stderr, "%s\n", error->description().c_str());
  std::exit(1);
}

double finishMilliseconds(const std::string& path, int seconds) {
  bool syncs = false;
  auto disk = DiskMovieFile::create(path);
  if (!disk) require(disk.error());
  MovieWriter writer(std::make_unique<ImpatientFile>(std::move(*disk), syncs),
                     {pictureTrack(), soundTrack(2), soundTrack(3)}, MovieWriter::Layout::Fragmented);
  require(writer.writeHeader());
  int64_t packets = 0;
  for (int second = 0; second < seconds; ++second) {
    std::vector<std::vector<EncodedSample>> samples(3);
    for (int i = 0; i < kPicturesPerSecond; ++i) {
      const auto bytes = kPictureBytes + static_cast<size_t>(second * 31 + i) % 64;
      const int64_t time = (int64_t{second} * kPicturesPerSecond + i) * kMovieTimescale / kPicturesPerSecond;
      samples[0].push_back({std::vector<uint8_t>(bytes), time, 0, kMovieTimescale / kPicturesPerSecond, i == 0});
    }
    addSound(samples[1], packets, second);
    samples[2] = samples[1];
    syncs = second + 1 == seconds;  // all but the finish is on the disk
    require(writer.writeFragment(samples));
  }
  const auto began = std::chrono::steady_clock::now();
  require(writer.finish({}));
  return std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - began).count();
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) {
    std::fprintf(stderr, "usage: bench_movie_finish DIRECTORY SECONDS...\n");
    return 2;
  }
  for (int i = 2; i < argc; ++i) {
    const std::string path = std::string(argv[1]) + "/finish.mp4";
    const int seconds = std::atoi(argv[i]);
    std::printf("%d %.1f\n", seconds, finishMilliseconds(path, seconds));
    (void)::unlink(path.c_str());
  }
}
