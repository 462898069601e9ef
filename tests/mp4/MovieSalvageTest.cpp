#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "platform/mp4/MP4MovieSalvage.h"
#include "tests/kit/ScratchFolder.h"
#include "tests/mp4/SmallMovie.h"

namespace qv::platform::mp4 {
namespace {

class MovieSalvageTest : public ::testing::Test {
 protected:
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
    return ticks;
  }

  MP4MovieSalvage salvage_;
  kit::ScratchFolder scratch_{"/dev/shm"};  // movies are synced many times
  const std::string path_ = scratch_ / "movie.mp4";
};

/// Cut at any byte, a growing movie has its whole fragments, and all that was there is there still.
TEST_F(MovieSalvageTest, SalvagesTheWholeFragmentsOfAMovieCutAnywhere) {
  const auto growing = movieOf(4, false);
  const int64_t lengths[] = {0, 9000, 19000, 25000, 30000};
  size_t whole = 0;
  for (size_t cut = 0; cut <= growing.size(); ++cut) {
    SCOPED_TRACE(cut);
    while (whole < 4 && cut >= movieOf(whole + 1, false).size()) ++whole;
    const int64_t length = salvaged(std::span(growing).first(cut));
    ASSERT_TRUE(whole == 0 || length >= lengths[whole]) << length;
    if (length <= 0) continue;
    ASSERT_LT(length, lengths[std::min<size_t>(whole + 1, 4)] + 1);
    auto kept = contents();
    ASSERT_GT(kept.size(), cut);
    kept.resize(cut);
    std::copy_n(growing.begin() + 40, 16, kept.begin() + 40);  // the placeholder, which is the head of the media now
    ASSERT_TRUE(std::ranges::equal(kept, std::span(growing).first(cut)));
    ASSERT_EQ(salvage_.stateOfMovie(path_).value(), MovieState::Finished);
    if (cut == movieOf(whole, false).size()) {
      ASSERT_EQ(layoutOf(contents()), layoutOf(movieOf(whole, true)));
    }
  }
  EXPECT_EQ(salvaged(movieOf(2, true)), -1);
}

TEST_F(MovieSalvageTest, ReadsNothingBeyondItsLimits) {
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
                        {"trak", 0, 0, 'x', 1, -2},
                        {"trak", 1, 0, 'x', 1, -2},
                        {"tkhd", 0, 24, 0, 4, -2},
                        {"tkhd", 0, 24, 16, 4, -2},
                        {"tkhd", 0, 24, 17, 4, -2},
                        {"mdhd", 0, 24, 0, 4, -2},
                        {"mdhd", 0, 24, 1, 4, int64_t{19000} * 90000},
                        {"elst", 0, 20, -1, 8, -2},
                        {"elst", 0, 20, 1, 8, 18999},
                        {"elst", 0, 20, 19000, 8, -2},
                        {"elst", 0, 20, kLimit - 1, 8, -2},
                        {"elst", 0, 20, kLimit, 8, -2},
                        {"hdlr", 0, 12, 'x', 1, -2},
                        {"avc1", 1, size_t(-4), 7, 4, -2},
                        {"avc1", 1, size_t(-4), 2000, 4, -2},
                        {"tfdt", 0, 8, kLimit - 1, 8, 19000},
                        {"tfdt", 0, 8, kLimit, 8, 17080},
                        {"tfdt", 2, 8, 6000, 8, 16000},
                        {"tfdt", 2, 8, 6001, 8, 16001},
                        {"tfdt", 2, 8, 6000 + int64_t{UINT32_MAX}, 8, 16000 + int64_t{UINT32_MAX}},
                        {"tfdt", 2, 8, 6001 + int64_t{UINT32_MAX}, 8, 16000 + int64_t{UINT32_MAX}},
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

TEST_F(MovieSalvageTest, SalvagesAMovieOfSixteenTracksAtMost) {
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

TEST_F(MovieSalvageTest, LeavesAloneWhatIsNoPlainFileOrIsBeingWritten) {
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

}  // namespace
}  // namespace qv::platform::mp4
