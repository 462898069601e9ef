#include "fuzz/MovieSeeds.h"

#include "platform/mp4/AnnexB.h"
#include "platform/mp4/MovieWriter.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::fuzz {
namespace {

using namespace qv::platform::mp4;

constexpr uint32_t kSoundRate = 44100;
constexpr int64_t kPictures = 4;  // of a fragment
constexpr int64_t kPackets = 6;
constexpr int64_t kPictureTicks = 18000;
constexpr int64_t kPacketFrames = 1024;

MovieTrack pictureTrack() {
  // The parameter sets of a stream of 64x64 pixels, High profile.
  static constexpr uint8_t kParameterSets[] = {
      0,    0,    0,    1,    0x67, 0x64, 0x00, 0x0a, 0xac, 0xd9, 0x44, 0x26, 0x84, 0x00, 0x00, 0x03, 0x00, 0x04, 0x00,
      0x00, 0x03, 0x00, 0xca, 0x3c, 0x48, 0x96, 0x58, 0,    0,    0,    1,    0x68, 0xeb, 0xe3, 0xcb, 0x22, 0xc0};
  MovieTrack track;
  track.width = 64;
  track.height = 64;
  track.sampleEntry = makeAVCSampleEntry(64, 64, makeAVCConfiguration(kParameterSets), {});
  return track;
}

MovieTrack soundTrack() {
  static constexpr uint8_t kStereoLowComplexity[] = {0x12, 0x10};
  MovieTrack track;
  track.trackID = 2;
  track.kind = MovieTrack::Kind::Audio;
  track.timescale = kSoundRate;
  track.mediaStart = kPacketFrames;
  track.sampleEntry = makeAACSampleEntry(kSoundRate, 2, 128000, kStereoLowComplexity);
  return track;
}

std::vector<std::vector<EncodedSample>> fragment(int64_t number) {
  std::vector<EncodedSample> pictures;
  for (int64_t i = 0; i < kPictures; ++i) {
    const int64_t time = (number * kPictures + i) * kPictureTicks;
    pictures.push_back({{0, 0, 0, 4, 0x41, 0x9a, 0, 0}, time, 0, kPictureTicks, i == 0});
  }
  std::vector<EncodedSample> packets;
  for (int64_t i = 0; i < kPackets; ++i) {
    const int64_t time = (number * kPackets + i) * kPacketFrames;
    packets.push_back({{0x21, 0x10, 0x04, 0x60, 0x8c, 0x1c}, time, 0, kPacketFrames, true});
  }
  return {pictures, packets};
}

std::string movie(int fragments, bool isFinished) {
  const kit::ScratchFolder folder("/dev/shm");
  MovieWriter writer(std::move(DiskMovieFile::create(folder / "movie.mp4").value()), {pictureTrack(), soundTrack()},
                     MovieWriter::Layout::Fragmented);
  (void)writer.writeHeader();
  for (int i = 0; i < fragments; ++i) (void)writer.writeFragment(fragment(i));
  if (isFinished) (void)writer.finish({});
  return folder.read("/movie.mp4");
}

}  // namespace

std::string growingMovie(int fragments) { return movie(fragments, false); }
std::string finishedMovie(int fragments) { return movie(fragments, true); }

}  // namespace qv::fuzz
