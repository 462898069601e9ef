#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "platform/mp4/AnnexB.h"
#include "platform/mp4/BoxReader.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "platform/mp4/MovieWriter.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::mp4 {
namespace {

class MovieWriterTest : public ::testing::Test {
 protected:
  static MovieTrack pictureTrack() {
    MovieTrack track;
    track.width = 64;
    track.height = 64;
    track.sampleEntry = makeAVCSampleEntry(64, 64, std::vector<uint8_t>(20), {});
    return track;
  }
  static std::vector<std::vector<EncodedSample>> second(int64_t number) {
    std::vector<EncodedSample> samples;
    for (int64_t i = 0; i < 10; ++i) {
      samples.push_back({std::vector<uint8_t>(100, 7), (number * 10 + i) * 9000, 0, 9000, i == 0});
    }
    return {samples};
  }
  /// A file as a crash leaves it after `seconds` whole fragments.
  void writeCrashed(int64_t seconds) {
    MovieWriter writer(std::move(DiskMovieFile::create(path_).value()), {pictureTrack()},
                       MovieWriter::Layout::Fragmented);
    ASSERT_FALSE(writer.writeHeader());
    for (int64_t i = 0; i < seconds; ++i) ASSERT_FALSE(writer.writeFragment(second(i)));
  }
  std::vector<uint8_t> contents() const {
    std::ifstream file(path_, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
  }

  MP4MovieSalvage salvage_;
  kit::ScratchFolder scratch_;
  const std::string path_ = scratch_ / "movie.mp4";
};

TEST_F(MovieWriterTest, IndexesMediaBeyondFourGigabytes) {
  constexpr uint64_t kFar = uint64_t{5} << 30;
  MovieWriter writer(std::move(DiskMovieFile::create(path_).value()), {pictureTrack()}, MovieWriter::Layout::Plain);
  ASSERT_FALSE(writer.writeHeader());
  const uint64_t placeholder = writer.size() - 16;
  writer.adopt(placeholder, kFar, std::vector<TrackIndex>(1));  // a sparse file
  ASSERT_FALSE(writer.writeFragment(second(0)));
  const uint64_t mediaEnd = writer.size();
  ASSERT_FALSE(writer.finish({}));
  std::ifstream file(path_, std::ios::binary);
  std::vector<uint8_t> head(16);
  file.seekg(static_cast<std::streamoff>(placeholder)).read(reinterpret_cast<char*>(head.data()), 16);
  ByteReader in(head);
  EXPECT_EQ(in.u32(), 1u);
  EXPECT_EQ(in.u32(), boxType("mdat"));
  EXPECT_EQ(in.u64(), mediaEnd - placeholder);
  std::vector<uint8_t> moov(std::filesystem::file_size(path_) - mediaEnd);
  file.seekg(static_cast<std::streamoff>(mediaEnd)).read(reinterpret_cast<char*>(moov.data()), std::ssize(moov));
  std::span<const uint8_t> at(moov);
  for (const uint32_t type : {boxType("moov"), boxType("trak"), boxType("mdia"), boxType("minf"), boxType("stbl")}) {
    at = findBox(at, type);
  }
  ByteReader offsets(findBox(at, boxType("co64")));
  offsets.skip(4);
  EXPECT_EQ(offsets.u32(), 1u);
  EXPECT_EQ(offsets.u64(), kFar);
}

TEST_F(MovieWriterTest, LeavesAloneWhatIsNoPlainFileOrIsBeingWritten) {
  writeCrashed(2);
  const auto before = contents();
  const std::string link = scratch_ / "link.mp4";
  std::filesystem::create_symlink(path_, link);
  for (const std::string& path : {link, scratch_.path(), scratch_ / "none"}) {
    EXPECT_FALSE(salvage_.stateOfMovie(path)) << path;
    EXPECT_FALSE(salvage_.salvageMovie(path)) << path;
  }
  EXPECT_EQ(contents(), before);
  EXPECT_EQ(salvage_.stateOfMovie(path_).value(), MovieState::Unfinished);

  std::filesystem::remove(path_);
  MovieWriter writer(std::move(DiskMovieFile::create(path_).value()), {pictureTrack()},
                     MovieWriter::Layout::Fragmented);
  ASSERT_FALSE(writer.writeHeader());
  ASSERT_FALSE(writer.writeFragment(second(0)));
  EXPECT_EQ(salvage_.stateOfMovie(path_).value(), MovieState::InUse);
  EXPECT_FALSE(salvage_.salvageMovie(path_));
  EXPECT_FALSE(writer.writeFragment(second(1)));
}

TEST_F(MovieWriterTest, SplitsByteStreams) {
  const std::vector<uint8_t> stream = {0,    0, 0, 1, 0x67, 100, 0,    31, 9, 0, 0, 1,
                                       0x68, 5, 0, 0, 0,    1,   0x65, 1,  0, 0, 3, 2};
  EXPECT_EQ(splitByteStream(stream).size(), 3u);
  EXPECT_EQ(lengthPrefixed(stream), (std::vector<uint8_t>{0, 0, 0, 6, 0x65, 1, 0, 0, 3, 2}));
  const auto configuration = makeAVCConfiguration(stream);
  ASSERT_GE(configuration.size(), 8u);
  EXPECT_EQ(configuration[1], 100);
  EXPECT_EQ(configuration[3], 31);
  EXPECT_TRUE(makeAVCConfiguration(std::vector<uint8_t>{0, 0, 1}).empty());
}

}  // namespace
}  // namespace qv::platform::mp4
