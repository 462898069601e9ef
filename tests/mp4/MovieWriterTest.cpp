#include <fcntl.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <limits>
#include <set>
#include <sstream>

#include "platform/mp4/AnnexB.h"
#include "tests/kit/ScratchFolder.h"
#include "tests/mp4/SmallMovie.h"

namespace qv::platform::mp4 {
namespace {

TEST(MovieWriterTest, LaysAGrowingMovieOutAsTheStandardSays) {
  EXPECT_EQ(layoutOf(movieOf(2, false)), words(R"(
ftyp 69736f6d 200 69736f6d 69736f32 69736f36 61766331 6d703431 6d703432
free 0*2
moov {
  mvhd 1000000 0*4 15f90 0*2 10000 1000000 0*2 10000 0*3 10000 0*3 40000000 0*6 3
  trak {
    tkhd 1000003 0*4 1 0*8 ffff0000 0*1 ffff0000 0*2 240000 400000 40000000 400000 240000
    edts { elst 1000000 1 0*4 10000 }
    mdia {
      mdhd 1000000 0*4 15f90 0*2 55c40000
      hdlr 0*2 76696465 0*3 0:1
      minf {
        vmhd 1 0*2
        dinf { dref 0*1 1 { url 1 } }
        stbl {
          stsd 0*1 1 {
            avc1 0*1 1 0*4 400024 480000 480000 0*1 10000 0*7 18 ffff:2 {
              avcC 1020304 colr 6e636c78 1000d 680:3 pasp 1 1 } }
          stts 0*2 stsc 0*2 stco 0*2 stsz 0*3 } } } }
  trak {
    tkhd 1000003 0*4 2 0*6 1000000 10000 0*3 10000 0*3 40000000 0*2
    edts { elst 1000000 1 0*3 400 10000 }
    mdia {
      mdhd 1000000 0*4 bb80 0*2 55c40000
      hdlr 0*2 736f756e 0*3 0:1
      minf {
        smhd 0*2
        dinf { dref 0*1 1 { url 1 } }
        stbl {
          stsd 0*1 1 {
            mp4a 0*1 1 0*2 20010 0*1 bb800000 {
              esds 0*1 3190000 41140 15001800 1f400 1f400 5021190 60102:3 } }
          stts 0*2 stsc 0*2 stco 0*2 stsz 0*3 } } } }
  mvex { trex 0*1 1 1 0*3 trex 0*1 2 1 0*3 } }
moof {
  mfhd 0*1 1
  traf {
    tfhd 20028 1 bb8 1010000 tfdt 1000000 0*2
    trun 205 2 e0 2000000 5 3 trun 205 1 e8 2000000 4 }
  traf { tfhd 20028 2 400 2000000 tfdt 1000000 0*2 trun 201 2 ec 2 2 } }
mdat 5050505 5030303 4040404 2020202
moof {
  mfhd 0*1 2
  traf { tfhd 20020 1 1010000 tfdt 1000000 0*1 2328 trun 301 2 c0 1770 6 fa0 1 }
  traf { tfhd 20028 2 400 2000000 tfdt 1000000 0*1 800 trun 201 1 c7 3 } }
mdat 6060606 6060103 303:2
)"));
}

/// With reordered pictures, sound that begins late, and all that comes after the end dropped.
TEST(MovieWriterTest, IndexesWhatIsShownOfAMovie) {
  Disk disk;
  MovieWriter writer(std::make_unique<MemoryFile>(disk), tracks(), MovieWriter::Layout::Plain);
  ASSERT_FALSE(writer.writeHeader());
  auto fragments = media();
  fragments[0][0][1].compositionOffset = 3000;
  for (const auto& fragment : fragments) ASSERT_FALSE(writer.writeFragment(fragment));
  const uint64_t mediaEnd = writer.size();
  writer.setTrackStart(1, 1024, 25900);
  ASSERT_FALSE(writer.finish({22000, 27000, 100}));
  EXPECT_EQ(disk.calls, "wsws");  // the head of the media only after the index is safe
  EXPECT_EQ(layoutOf(std::span(disk.bytes).subspan(40, 16)), words("1 6d646174 0*1 34 "));
  const std::set<std::string> kOfTimes{"mvhd", "tkhd", "elst", "mdhd", "stts", "ctts", "stss", "stsz", "stsc", "stco"};
  std::istringstream all(layoutOf(std::span(disk.bytes).subspan(mediaEnd)));
  std::string shown;
  bool isOfTimes = false;
  for (std::string word; all >> word;) {
    const bool isName = word.size() == 4 && std::all_of(word.begin(), word.begin() + 3, ::isalpha);
    if (isName || word == "{" || word == "}") isOfTimes = kOfTimes.contains(word);
    if (isOfTimes) shown += word + "\n";
  }
  EXPECT_EQ(shown, words(R"(
mvhd 1000000 0*4 15f90 0*1 69dc 10000 1000000 0*2 10000 0*3 10000 0*3 40000000 0*6 3
tkhd 1000003 0*4 1 0*2 69dc 0*5 ffff0000 0*1 ffff0000 0*2 240000 400000 40000000 400000 240000
elst 1000000 1 0*1 69dc 0*2 10000
mdhd 1000000 0*4 15f90 0*1 69dc 55c40000
stts 0*1 5 3 bb8 1 1770 1 fa0 1 bb8 1 13ec
ctts 1000000 3 1 0*1 1 bb8 5 0*1
stss 0*1 3 1 3 6
stsz 0*2 7 5 3 4 6 1 2 1
stsc 0*1 2 1 3 1 2 2 1
stco 0*1 3 38 48 52
tkhd 1000003 0*4 2 0*2 69dc 0*3 1000000 10000 0*3 10000 0*3 40000000 0*2
elst 1000000 2 0*1 652c ffffffff ffffffff 10000 0*1 4b0 0*1 400 10000
mdhd 1000000 0*4 bb80 0*1 800 55c40000
stts 0*1 1 2 400
stsz 0*2 2 2 2
stsc 0*1 1 1 2 1
stco 0*1 1 44
)"));
}

TEST(MovieWriterTest, FinishesNothingOfWhichNothingIsShown) {
  Disk disk;
  MovieWriter writer(std::make_unique<MemoryFile>(disk), {tracks()[1]}, MovieWriter::Layout::Plain);
  ASSERT_FALSE(writer.writeHeader());
  ASSERT_FALSE(writer.writeFragment({media()[0][1]}));
  writer.setTrackStart(0, 1024, 100);
  EXPECT_EQ(writer.movieDuration({}), 2020u);
  EXPECT_EQ(writer.finish({{}, 100, 0})->code, kMovieWithoutMedia);
  writer.setTrackStart(0, 2048, 0);
  EXPECT_EQ(writer.movieDuration({}), 0u);
  EXPECT_EQ(writer.finish({{}, 50, 0})->code, kMovieWithoutMedia);
}

TEST(MovieWriterTest, IndexesMediaBeyondFourGigabytes) {
  const kit::ScratchFolder scratch;
  const std::string path = scratch / "movie.mp4";
  for (const uint64_t far : {uint64_t{UINT32_MAX}, uint64_t{UINT32_MAX} + 1}) {
    std::filesystem::remove(path);
    MovieWriter writer(std::move(DiskMovieFile::create(path).value()), tracks(), MovieWriter::Layout::Plain);
    ASSERT_FALSE(writer.writeHeader());
    writer.adopt(writer.size() - 16, far, std::vector<TrackIndex>(2));  // a sparse file
    ASSERT_FALSE(writer.writeFragment({media()[2]}));
    const uint64_t mediaEnd = writer.size();
    ASSERT_FALSE(writer.finish({}));
    std::ifstream file(path, std::ios::binary);
    std::vector<uint8_t> moov(std::filesystem::file_size(path) - mediaEnd);
    file.seekg(static_cast<std::streamoff>(mediaEnd)).read(reinterpret_cast<char*>(moov.data()), std::ssize(moov));
    const bool isLarge = far > UINT32_MAX;
    EXPECT_NE(layoutOf(moov).find(words(isLarge ? "co64 0*1 1 1 0*1 } " : "stco 0*1 1 ffffffff } ")), std::string::npos)
        << far;
  }
}

/// Whichever step fails: it is told, and what was whole before is left, to be finished then or later.
TEST(MovieWriterTest, KeepsTheWholeFragmentsWhateverFails) {
  for (size_t step = 0;; ++step) {
    SCOPED_TRACE(step);
    Disk disk;
    disk.failsAt = step;
    MovieWriter writer(std::make_unique<MemoryFile>(disk), tracks(), MovieWriter::Layout::Fragmented);
    auto error = writer.writeHeader();
    size_t begun = 0;
    while (!error && begun < 4) error = writer.writeFragment(media()[begun++]);
    const bool isComplete = !error;
    if (isComplete) error = writer.finish({});
    if (disk.steps <= step) break;
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, ENOSPC);
    ASSERT_EQ(disk.bytes.size(), writer.size());
    if (isComplete) continue;
    const size_t whole = disk.calls.ends_with('t') && begun > 0 ? begun - 1 : begun;
    if (whole == 0) {
      EXPECT_EQ(writer.finish({})->code, kMovieWithoutMedia);
    } else {
      ASSERT_FALSE(writer.finish({}));
      EXPECT_EQ(disk.bytes, movieOf(whole, true));
    }
  }
}

TEST(MovieWriterTest, TellsWhatTheDiskSays) {
  DiskMovieFile file(FileDescriptor(::open("/dev/full", O_WRONLY | O_CLOEXEC)));
  EXPECT_EQ(writeFully(file, std::vector<uint8_t>(9), 0)->code, ENOSPC);
  EXPECT_EQ(file.truncate(0), EINVAL);
  EXPECT_EQ(file.sync(), EINVAL);
  struct : MovieFile {
    int64_t writeAt(std::span<const uint8_t>, uint64_t) override { return 0; }
    int truncate(uint64_t) override { return 0; }
    int sync() override { return 0; }
    int close() override { return 0; }
  } stuck;
  EXPECT_EQ(writeFully(stuck, std::vector<uint8_t>(9), 0)->code, EIO);
}

TEST(MovieWriterTest, TakesByteStreamsApart) {
  const std::vector<uint8_t> stream = {7, 0,    0,    0, 1, 0x67, 100, 0, 31,   9, 0, 0, 1, 0x67, 1,    2, 3, 0,
                                       0, 1,    0x68, 5, 0, 0,    0,   1, 0x68, 6, 0, 0, 1, 9,    0x10, 0, 0, 0,
                                       1, 0x65, 1,    0, 0, 3,    2,   0, 0,    1, 0, 0, 1, 0x41, 8,    0, 0, 1};
  EXPECT_EQ(splitByteStream(stream).size(), 7u);
  EXPECT_EQ(lengthPrefixed(stream), (std::vector<uint8_t>{0, 0, 0, 6, 0x65, 1, 0, 0, 3, 2, 0, 0, 0, 2, 0x41, 8}));
  EXPECT_EQ(makeAVCConfiguration(stream), (std::vector<uint8_t>{1,  100, 0, 31, 0xFF, 0xE1, 0, 5,    0x67, 100,  0,
                                                                31, 9,   1, 0,  2,    0x68, 5, 0xFD, 0xF8, 0xF8, 0}));
  // Without the last part below the High profile; nothing of what lacks a parameter set or has but a piece of one.
  EXPECT_EQ(makeAVCConfiguration(std::vector<uint8_t>{0, 0, 1, 0x67, 77, 0, 31, 0, 0, 1, 0x68}).size(), 16u);
  EXPECT_TRUE(makeAVCConfiguration(std::vector<uint8_t>{0, 0, 1, 0x67, 77, 3, 0, 0, 1, 0x68}).empty());
  EXPECT_TRUE(makeAVCConfiguration(std::vector<uint8_t>{0, 0, 1, 0x67, 77, 0, 31, 9}).empty());
  EXPECT_TRUE(splitByteStream(std::vector<uint8_t>{0, 0}).empty());
}

}  // namespace
}  // namespace qv::platform::mp4
