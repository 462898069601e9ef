#include "bench/movies/MadeUpMovie.h"

#include <malloc.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <vector>

#include "platform/mp4/MovieRecorder.h"

namespace qv::bench {
namespace {

using namespace qv::platform;
using namespace qv::platform::mp4;

constexpr int kPicturesPerSecond = 60;
constexpr int64_t kSoundRate = 44100, kPacketFrames = 1024;
constexpr size_t kPictureBytes = 3'000'000 / 8 / kPicturesPerSecond;
constexpr size_t kKeyPictureBytes = 8 * kPictureBytes;
constexpr size_t kPacketBytes = 128'000 / 8 * kPacketFrames / kSoundRate;

/// Leaves out the syncs while the movie is being made, which are not measured.
class ImpatientFile final : public MovieFile {
 public:
  ImpatientFile(std::unique_ptr<MovieFile> file, const bool& syncs) : file_(std::move(file)), syncs_(syncs) {}
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) override { return file_->writeAt(bytes, offset); }
  int truncate(uint64_t size) override { return file_->truncate(size); }
  int sync() override { return syncs_ ? file_->sync() : 0; }
  int close() override { return file_->close(); }

 private:
  std::unique_ptr<MovieFile> file_;
  const bool& syncs_;
};

/// Takes all and keeps nothing.
class CountingFile final : public MovieFile {
 public:
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t) override { return static_cast<int64_t>(bytes.size()); }
  int truncate(uint64_t) override { return 0; }
  int sync() override { return 0; }
  int close() override { return 0; }
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

void require(const std::optional<Error>& error) {
  if (!error) return;
  std::fprintf(stderr, "%s\n", error->description().c_str());
  std::exit(1);
}

/// The samples of a recording, in fragments as MovieRecorder makes them.
class Source {
 public:
  explicit Source(size_t soundTracks) : soundTracks_(soundTracks) {}
  std::vector<std::vector<EncodedSample>> nextFragment() {
    std::vector<std::vector<EncodedSample>> samples(1 + soundTracks_);
    constexpr int64_t kTicks = MovieRecorder::kFragmentLength.count() * kMovieTimescale / 1000;
    end_ += kTicks;
    for (; pictureTime() < end_; ++picture_) {
      const bool isKey = picture_ % kPicturesPerSecond == 0;
      // Sizes spread as those of an encoder do, around a mean that counts the key frames.
      const size_t mean = (kPictureBytes * kPicturesPerSecond - kKeyPictureBytes) / (kPicturesPerSecond - 1);
      const size_t bytes = isKey ? kKeyPictureBytes : mean / 2 + static_cast<size_t>(picture_ * 7919) % mean;
      add(samples[0], {std::vector<uint8_t>(bytes), pictureTime(), 0, kMovieTimescale / kPicturesPerSecond, isKey});
    }
    for (; packet_ * kPacketFrames * kMovieTimescale < end_ * kSoundRate; ++packet_) {
      const size_t bytes = kPacketBytes - 20 + static_cast<size_t>(packet_ * 31) % 41;
      for (size_t track = 1; track <= soundTracks_; ++track) {
        add(samples[track], {std::vector<uint8_t>(bytes), packet_ * kPacketFrames, 0, kPacketFrames, true});
      }
    }
    return samples;
  }
  [[nodiscard]] double seconds() const { return static_cast<double>(end_) / kMovieTimescale; }
  [[nodiscard]] uint64_t mediaBytes() const { return mediaBytes_; }

 private:
  /// Captured times are never quite regular.
  [[nodiscard]] int64_t pictureTime() const {
    return picture_ * kMovieTimescale / kPicturesPerSecond + picture_ * 7919 % 97;
  }
  void add(std::vector<EncodedSample>& samples, EncodedSample sample) {
    mediaBytes_ += sample.data.size();
    samples.push_back(std::move(sample));
  }
  const size_t soundTracks_;
  int64_t end_ = 0, picture_ = 0, packet_ = 0;
  uint64_t mediaBytes_ = 0;
};

std::unique_ptr<MovieFile> makeFile(const std::string& path, bool keepsBytes, const bool& syncs) {
  if (!keepsBytes) return std::make_unique<CountingFile>();
  auto disk = DiskMovieFile::create(path);
  if (!disk) require(disk.error());
  return std::make_unique<ImpatientFile>(std::move(*disk), syncs);
}

}  // namespace

int64_t residentBytes() {
  std::FILE* file = std::fopen("/proc/self/statm", "r");
  long total = 0, resident = 0;
  if (file == nullptr || std::fscanf(file, "%ld %ld", &total, &resident) != 2) std::abort();
  std::fclose(file);
  return int64_t{resident} * ::sysconf(_SC_PAGESIZE);
}

MadeUpMovie makeUpMovie(const std::string& path, int seconds, size_t soundTracks, bool keepsBytes) {
  ::malloc_trim(0);  // what was freed before would hide how memory grows
  bool syncs = false;
  std::vector<MovieTrack> tracks = {pictureTrack()};
  for (size_t i = 0; i < soundTracks; ++i) tracks.push_back(soundTrack(static_cast<uint32_t>(i + 2)));
  MovieWriter writer(makeFile(path, keepsBytes, syncs), std::move(tracks), MovieWriter::Layout::Fragmented);
  require(writer.writeHeader());
  Source source(soundTracks);
  int64_t afterAMinute = 0;
  while (source.seconds() < seconds) {
    const auto fragment = source.nextFragment();
    syncs = source.seconds() >= seconds;  // all but the finish is on the disk
    require(writer.writeFragment(fragment));
    if (afterAMinute == 0 && source.seconds() >= std::min(60, seconds)) afterAMinute = residentBytes();
  }
  const auto began = std::chrono::steady_clock::now();
  require(writer.finish({}));
  MadeUpMovie movie;
  movie.finishMilliseconds =
      std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - began).count();
  movie.mediaBytes = source.mediaBytes();
  movie.fileBytes = writer.size();
  movie.memoryGrowth = residentBytes() - afterAMinute;
  return movie;
}

}  // namespace qv::bench
