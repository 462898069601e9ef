#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <future>
#include <limits>
#include <semaphore>
#include <set>
#include <sstream>

#include "platform/mp4/AnnexB.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "platform/mp4/MovieRecorder.h"
#include "platform/mp4/MovieWriter.h"
#include "tests/kit/ScratchFolder.h"
#include "tests/mp4/MovieLayout.h"

namespace qv::platform::mp4 {
namespace {

using Fragment = std::vector<std::vector<EncodedSample>>;

EncodedSample sample(size_t size, int64_t time, uint32_t duration, bool isSync = true) {
  return {std::vector<uint8_t>(size, static_cast<uint8_t>(size)), time, 0, duration, isSync};
}

class MovieWriterTest : public ::testing::Test {
 protected:
  static std::vector<MovieTrack> tracks() {
    MovieTrack picture;
    picture.width = 64;
    picture.height = 36;
    picture.matrix = displayMatrix({0, -1, -1, 0, 0, 0}, 64, 36);
    picture.sampleEntry = makeAVCSampleEntry(64, 36, std::vector<uint8_t>{1, 2, 3, 4}, {1, 13, 6, true});
    MovieTrack sound;
    sound.trackID = 2;
    sound.kind = MovieTrack::Kind::Audio;
    sound.timescale = 48000;
    sound.mediaStart = 1024;
    sound.sampleEntry = makeAACSampleEntry(48000, 2, 128000, std::vector<uint8_t>{0x11, 0x90});
    return {picture, sound};
  }
  /// Regular and not, begun by a key frame and not, with sound and without.
  static std::vector<Fragment> media() {
    return {{{sample(5, 0, 3000), sample(3, 3000, 3000, false), sample(4, 6000, 3000)},
             {sample(2, 512, 1024), sample(2, 1536, 1024)}},
            {{sample(6, 9000, 6000, false), sample(1, 15000, 4000, false)}, {sample(3, 2560, 1024)}},
            {{sample(2, 19000, 3000), sample(1, 22000, 3000, false)}, {}},
            {{sample(7, 25000, 5000)}, {}}};
  }
  /// The movie of the first fragments: as a crash leaves it, or finished.
  static std::vector<uint8_t> movieOf(size_t fragments, bool isFinished) {
    Disk disk;
    MovieWriter writer(std::make_unique<MemoryFile>(disk), tracks(), MovieWriter::Layout::Fragmented);
    EXPECT_FALSE(writer.writeHeader());
    for (size_t i = 0; i < fragments; ++i) EXPECT_FALSE(writer.writeFragment(media()[i]));
    EXPECT_FALSE(isFinished && writer.finish({}));
    return disk.bytes;
  }
  void write(std::span<const uint8_t> bytes) { scratch_.write("/movie.mp4", {bytes.begin(), bytes.end()}); }
  std::vector<uint8_t> contents() const {
    const std::string text = scratch_.read("/movie.mp4");
    return {text.begin(), text.end()};
  }
  /// What a salvage says of a file of these bytes: its length in ticks, -1 where there is nothing to do, -2 where it is
  /// refused. Only a file with a length may have changed.
  int64_t salvaged(std::span<const uint8_t> bytes) {
    write(bytes);
    auto length = salvage_.salvageMovie(path_);
    const int64_t ticks = !length ? -2 : !length->isValid() ? -1 : length->valueAt(kMovieTimescale);
    EXPECT_TRUE(ticks > 0 || std::ranges::equal(contents(), bytes));
    EXPECT_TRUE(length || length.error().code == kMovieNotReadable);
    return ticks;
  }

  MP4MovieSalvage salvage_;
  kit::ScratchFolder scratch_{"/dev/shm"};  // movies are synced many times
  const std::string path_ = scratch_ / "movie.mp4";
};

TEST_F(MovieWriterTest, LaysAGrowingMovieOutAsTheStandardSays) {
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
  traf { tfhd 20028 2 400 2000000 tfdt 1000000 0*1 200 trun 201 2 ec 2 2 } }
mdat 5050505 5030303 4040404 2020202
moof {
  mfhd 0*1 2
  traf { tfhd 20020 1 1010000 tfdt 1000000 0*1 2328 trun 301 2 c0 1770 6 fa0 1 }
  traf { tfhd 20028 2 400 2000000 tfdt 1000000 0*1 a00 trun 201 1 c7 3 } }
mdat 6060606 6060103 303:2
)"));
}

/// With reordered pictures, sound that begins late, and all that comes after the end dropped.
TEST_F(MovieWriterTest, IndexesWhatIsShownOfAMovie) {
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

TEST_F(MovieWriterTest, FinishesNothingOfWhichNothingIsShown) {
  Disk disk;
  MovieWriter writer(std::make_unique<MemoryFile>(disk), {tracks()[1]}, MovieWriter::Layout::Plain);
  ASSERT_FALSE(writer.writeHeader());
  ASSERT_FALSE(writer.writeFragment({media()[0][1]}));
  writer.setTrackStart(0, 1024, 100);
  EXPECT_EQ(writer.movieDuration({}), 2980u);
  EXPECT_EQ(writer.finish({{}, 100, 0})->code, kMovieWithoutMedia);
  writer.setTrackStart(0, 2560, 0);
  EXPECT_EQ(writer.movieDuration({}), 0u);
  EXPECT_EQ(writer.finish({{}, 50, 0})->code, kMovieWithoutMedia);
}

/// Cut at any byte, a growing movie is finished as its writer would have done after the last whole fragment.
TEST_F(MovieWriterTest, SalvagesTheWholeFragmentsOfAMovieCutAnywhere) {
  const auto growing = movieOf(4, false);
  const int64_t lengths[] = {0, 9000, 19000, 25000, 30000};
  size_t whole = 0;
  for (size_t cut = 0; cut <= growing.size(); ++cut) {
    SCOPED_TRACE(cut);
    while (whole < 4 && cut >= movieOf(whole + 1, false).size()) ++whole;
    const bool isOurs = cut >= movieOf(0, false).size();
    ASSERT_EQ(salvaged(std::span(growing).first(cut)), isOurs ? lengths[whole] : -2);
    ASSERT_EQ(salvage_.stateOfMovie(path_).hasValue(), isOurs);
    if (whole == 0) continue;
    ASSERT_EQ(contents(), movieOf(whole, true));
    ASSERT_EQ(salvage_.stateOfMovie(path_).value(), MovieState::Finished);
  }
  const auto finished = movieOf(2, true);
  EXPECT_EQ(salvaged(finished), -1);
  for (size_t cut = 0; cut < finished.size(); cut += 7) EXPECT_EQ(salvaged(std::span(finished).first(cut)), -2) << cut;
}

/// Of the second fragment's head any byte is turned over: the fragment is kept only where the byte says nothing of its
/// place and size.
TEST_F(MovieWriterTest, KeepsNoFragmentWhoseHeadDoesNotFit) {
  std::istringstream fates(R"(
    moof: xxxxxxxx mfhd: xxxx............
    traf: xxxxxxxx tfhd: xxxxxxxx xxxxxxxx.... tfdt: xxxxxxxx ....xxxx....
    trun: xxxxxxxx xxxxxxxxxxxx ....xxxx....xxxx
    traf: xxxxxxxx tfhd: xxxxxxxx xxxxxxxx........ tfdt: xxxxxxxx ....xxxx....
    trun: xxxxxxxx xxxxxxxxxxxx xxxx)");
  std::string expected;
  for (std::string word; fates >> word;) expected += word.ends_with(':') ? "" : word;
  const auto growing = movieOf(2, false);
  const size_t head = movieOf(1, false).size();
  std::string found;
  for (size_t i = 0; i < expected.size(); ++i) {
    auto damaged = growing;
    damaged[head + i] ^= 0xFF;
    found += salvaged(damaged) == 9000 ? 'x' : '.';
  }
  EXPECT_EQ(found, expected);
}

TEST_F(MovieWriterTest, ReadsNothingBeyondItsLimits) {
  constexpr int64_t kLimit = int64_t{1} << 52;
  struct Case {
    const char* box;
    int number;  // of the boxes of that name
    size_t at;   // from the box's name
    int64_t value;
    int size;
    int64_t length;
  };
  for (const Case& c : {Case{"ftyp", 0, 0, 'x', 1, -2},
                        {"free", 0, 0, 'x', 1, -2},
                        {"free", 0, 4, 1, 8, 19000},
                        {"moov", 0, 0, 'x', 1, -2},
                        {"trak", 0, 0, 'x', 1, 0},
                        {"trak", 1, 0, 'x', 1, 0},
                        {"tkhd", 0, 24, 0, 4, -2},
                        {"tkhd", 0, 24, 16, 4, 0},
                        {"tkhd", 0, 24, 17, 4, -2},
                        {"mdhd", 0, 24, 0, 4, -2},
                        {"mdhd", 0, 24, 1, 4, int64_t{19000} * 90000},
                        {"elst", 0, 20, -1, 8, -2},
                        {"elst", 0, 20, 1, 8, 18999},
                        {"elst", 0, 20, 19000, 8, 0},
                        {"elst", 0, 20, kLimit - 1, 8, 0},
                        {"elst", 0, 20, kLimit, 8, -2},
                        {"hdlr", 0, 12, 'x', 1, 0},
                        {"avc1", 1, size_t(-4), 7, 4, -2},
                        {"avc1", 1, size_t(-4), 2000, 4, -2},
                        {"tfdt", 0, 8, kLimit - 1, 8, kLimit - 1 + 9000},
                        {"tfdt", 0, 8, kLimit, 8, 0},
                        {"tfdt", 2, 8, 6000, 8, 9000},
                        {"tfdt", 2, 8, 6001, 8, 16001},
                        {"tfdt", 2, 8, 6000 + int64_t{UINT32_MAX}, 8, 16000 + int64_t{UINT32_MAX}},
                        {"tfdt", 2, 8, 6001 + int64_t{UINT32_MAX}, 8, 9000},
                        {"trun", 3, 16, 0, 4, 9000},
                        {"trun", 3, 16, 1, 4, 13001},
                        {"moof", 1, 0, 'x', 1, 9000},
                        {"mdat", 1, 0, 'x', 1, 9000}}) {
    auto movie = movieOf(2, false);
    auto box = movie.begin();
    const std::string_view name(c.box);
    for (int i = 0; i <= c.number; ++i) box = std::search(box + 1, movie.end(), name.begin(), name.end());
    for (int i = 0; i < c.size; ++i) box[c.at + i] = static_cast<uint8_t>(c.value >> 8 * (c.size - 1 - i));
    EXPECT_EQ(salvaged(movie), c.length) << c.box << c.number << ' ' << c.value;
  }
}

TEST_F(MovieWriterTest, SalvagesAMovieOfSixteenTracksAtMost) {
  for (const size_t count : {16, 17}) {
    Disk disk;
    MovieWriter writer(std::make_unique<MemoryFile>(disk), std::vector(count, tracks()[0]),
                       MovieWriter::Layout::Fragmented);
    ASSERT_FALSE(writer.writeHeader());
    Fragment fragment(count);
    fragment[0] = media()[0][0];
    ASSERT_FALSE(writer.writeFragment(fragment));
    EXPECT_EQ(salvaged(disk.bytes), count == 16 ? 9000 : -2);
  }
}

TEST_F(MovieWriterTest, IndexesMediaBeyondFourGigabytes) {
  for (const uint64_t far : {uint64_t{UINT32_MAX}, uint64_t{UINT32_MAX} + 1}) {
    std::filesystem::remove(path_);
    MovieWriter writer(std::move(DiskMovieFile::create(path_).value()), tracks(), MovieWriter::Layout::Plain);
    ASSERT_FALSE(writer.writeHeader());
    writer.adopt(writer.size() - 16, far, std::vector<TrackIndex>(2));  // a sparse file
    ASSERT_FALSE(writer.writeFragment({media()[2]}));
    const uint64_t mediaEnd = writer.size();
    ASSERT_FALSE(writer.finish({}));
    std::ifstream file(path_, std::ios::binary);
    std::vector<uint8_t> moov(std::filesystem::file_size(path_) - mediaEnd);
    file.seekg(static_cast<std::streamoff>(mediaEnd)).read(reinterpret_cast<char*>(moov.data()), std::ssize(moov));
    const bool isLarge = far > UINT32_MAX;
    EXPECT_NE(layoutOf(moov).find(words(isLarge ? "co64 0*1 1 1 0*1 } " : "stco 0*1 1 ffffffff } ")), std::string::npos)
        << far;
  }
}

/// Whichever step fails: it is told, and what was whole before is left, to be finished then or later.
TEST_F(MovieWriterTest, KeepsTheWholeFragmentsWhateverFails) {
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

/// By the samples' times. The disk lags: it begins when all has been appended.
TEST_F(MovieWriterTest, RecordsInFragmentsWithOrWithoutAFinish) {
  const auto timeOf = [](int64_t i) { return i * 3000 - (i < 48 ? 0 : 24); };  // 48 is just within its fragment
  for (const bool isFinished : {true, false}) {
    Disk disk, wanted;
    std::promise<void> appended, told;
    std::string thread(16, 0);
    disk.atFirst = [&] {
      appended.get_future().wait();
      ::pthread_getname_np(::pthread_self(), thread.data(), thread.size());
    };
    {
      MovieRecorder recorder(std::make_unique<MemoryFile>(disk), tracks(), [](const Error&) { ADD_FAILURE(); });
      for (int64_t i = 0; i < 60; ++i) {
        recorder.append(0, sample(5, timeOf(i), 2000, i % 10 == 0));
        recorder.append(1, sample(2, i * 1500, 1500));
      }
      const auto done = [&](const auto& error) {
        EXPECT_FALSE(error);
        told.set_value();
      };
      isFinished ? recorder.finish({}, done) : told.set_value();
      appended.set_value();
      told.get_future().wait();
    }
    EXPECT_STREQ(thread.c_str(), "qv-movie-file");
    MovieWriter writer(std::make_unique<MemoryFile>(wanted), tracks(), MovieWriter::Layout::Fragmented);
    ASSERT_FALSE(writer.writeHeader());
    Fragment fragment(2);
    for (int64_t i = 0; i < 60; ++i) {
      // The last picture of a fragment lasts until the next one.
      const bool isLast = i == 23 || i == 48;
      fragment[0].push_back(sample(5, timeOf(i), isLast ? 3000 : 2000, i % 10 == 0));
      fragment[1].push_back(sample(2, i * 1500, 1500));
      ASSERT_FALSE((isLast || i == 59) && writer.writeFragment(std::exchange(fragment, Fragment(2))));
    }
    ASSERT_FALSE(isFinished && writer.finish({}));
    EXPECT_EQ(disk.bytes, wanted.bytes);
  }
}

/// What comes singly is on disk after the time of a fragment, without more to come.
TEST_F(MovieWriterTest, RecordsByTheClockWhatNothingFollows) {
  Disk disk;
  std::counting_semaphore<> synced(0);
  disk.atSync = [&] { synced.release(); };
  MovieRecorder recorder(std::make_unique<MemoryFile>(disk), tracks(), [](const Error&) { ADD_FAILURE(); });
  for (int64_t i = 0; i < 2; ++i) {
    const auto begin = std::chrono::steady_clock::now();
    recorder.append(0, sample(i == 0 ? MovieRecorder::kMaximumQueuedBytes : 1, i * 9000, 3000));
    synced.acquire();
    EXPECT_GE(std::chrono::steady_clock::now() - begin, MovieRecorder::kFragmentLength);
  }
}

TEST_F(MovieWriterTest, ARecorderWhoseDiskFailsTellsItAndHoldsNobodyUp) {
  Disk disk;
  std::promise<void> isFull;
  std::vector<int64_t> codes;
  disk.failsAt = 0;
  disk.atFirst = [&] { isFull.get_future().wait(); };
  {
    MovieRecorder recorder(std::make_unique<MemoryFile>(disk), tracks(),
                           [&](const Error& e) { codes.push_back(e.code); });
    recorder.append(0, sample(MovieRecorder::kMaximumQueuedBytes, 0, 3000));
    isFull.set_value();
    recorder.append(0, sample(MovieRecorder::kMaximumQueuedBytes, 90000, 3000));
    recorder.append(0, sample(1, 180000, 3000));
    recorder.finish({}, [&](const auto& e) { codes.push_back(e ? e->code : 0); });
  }
  EXPECT_EQ(codes, (std::vector<int64_t>{ENOSPC, ENOSPC}));
  EXPECT_TRUE(disk.bytes.empty());
}

TEST_F(MovieWriterTest, LeavesAloneWhatIsNoPlainFileOrIsBeingWritten) {
  write(movieOf(2, false));
  const std::string link = scratch_ / "link.mp4";
  std::filesystem::create_symlink(path_, link);
  for (const auto& [path, code] : {std::pair(link, ELOOP), {scratch_.path(), EINVAL}, {scratch_ / "none", ENOENT}}) {
    EXPECT_EQ(salvage_.stateOfMovie(path).error().code, code) << path;
    EXPECT_FALSE(salvage_.salvageMovie(path)) << path;
  }
  EXPECT_EQ(DiskMovieFile::create(path_).error().code, EEXIST);
  EXPECT_EQ(contents(), movieOf(2, false));

  std::filesystem::remove(path_);
  auto file = std::move(DiskMovieFile::create(path_).value());
  const FileDescriptor alsoHeld(::dup(static_cast<DiskMovieFile&>(*file).fd()));
  EXPECT_FALSE(writeFully(*file, movieOf(1, false), 0));
  EXPECT_EQ(static_cast<int>(std::filesystem::status(path_).permissions()) & 0133, 0);
  EXPECT_EQ(salvage_.stateOfMovie(path_).value(), MovieState::InUse);
  EXPECT_EQ(salvage_.salvageMovie(path_).error().code, EWOULDBLOCK);
  file.reset();
  EXPECT_EQ(salvage_.stateOfMovie(path_).value(), MovieState::Unfinished);
}

TEST_F(MovieWriterTest, TellsWhatTheDiskSays) {
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

TEST_F(MovieWriterTest, TakesByteStreamsApart) {
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
