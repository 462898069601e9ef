#include "support/QVUnfinishedMovies.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "tests/fakes/FakeMovieSalvage.h"
#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using platform::MovieState;

constexpr const char kMoviesStore[] = "/root/private/var/mobile/Library/Quorvel/";

class UnfinishedMoviesTest : public SupportTest {
 protected:
  UnfinishedMoviesTest() {
    platform_.movieSalvage = &salvage_;
    for (const char* name : {"Chess.mp4", "Done.mp4", "Live.mp4", "text.mp4", "Chess.mp4.7-1.partial"}) add(name);
    salvage_.states = {
        {"Chess.mp4", MovieState::Unfinished}, {"Done.mp4", MovieState::Finished}, {"Live.mp4", MovieState::InUse}};
  }
  void add(const std::string& name) { disk_.addFile(kMoviesStore + name, name, {fakes::FakeClock::kStart}); }
  void salvage() {
    (void)QVUnfinishedMovies(files_, *platform_.movieSalvage, localization_)._srSalvageUnfinishedMovies();
  }
  /// Under which a movie of this name is kept, without the extension.
  std::string stemOf(const std::string& name) {
    return name + "_recovered_" + localization_.formatDate({fakes::FakeClock::kStart}, "MM-dd-yyyy HH-mm-ss");
  }
  std::vector<std::string> names() { return disk_.contentsOfDirectory(kMoviesStore).value(); }

  fakes::FakeMovieSalvage salvage_;
};

TEST_F(UnfinishedMoviesTest, AreFinishedUnderANameThatNoRecordingTakes) {
  salvage();
  const std::string kept = stemOf("Chess") + ".mp4";
  EXPECT_EQ(salvage_.salvaged, std::vector<std::string>{kept});
  EXPECT_EQ(log_.countContaining("\"text.mp4\" cannot be looked at"), 1u);
  EXPECT_EQ(names(), (std::vector<std::string>{"Chess.mp4.7-1.partial", kept, "Done.mp4", "Live.mp4", "text.mp4"}));

  // The same application crashed at the same moment of a clock that had begun anew.
  add("Chess.mp4");
  salvage();
  EXPECT_EQ(salvage_.salvaged, (std::vector<std::string>{kept, stemOf("Chess") + " 2.mp4"}));

  // One that a full disk kept from being finished is tried again, under the name that it has.
  salvage_.states[kept] = MovieState::Unfinished;
  salvage_.length = platform::Error::posix(ENOSPC, "disk");
  const auto before = names();
  salvage();
  EXPECT_EQ(salvage_.salvaged.back(), kept);
  EXPECT_EQ(names(), before);

  salvage_.length = platform::MediaTime::zero();
  salvage();
  EXPECT_FALSE(disk_.itemExists(kMoviesStore + kept));
}

TEST_F(UnfinishedMoviesTest, StayAsTheyAreWhereNoNameCanBeHad) {
  const std::string longName(240, 'x');
  add(longName + ".mp4");
  salvage_.states[longName + ".mp4"] = MovieState::Unfinished;
  disk_.failOn(fakes::ScratchDisk::Operation::Attributes, std::string(kMoviesStore) + "Chess.mp4", EIO);
  auto before = names();
  salvage();
  EXPECT_EQ(names(), before);
  EXPECT_EQ(log_.countContaining(std::strerror(ENAMETOOLONG)), 1u);
  EXPECT_EQ(log_.countContaining(std::strerror(EIO)), 1u);

  disk_.failOn(fakes::ScratchDisk::Operation::Attributes, std::string(kMoviesStore) + "Chess.mp4", 0);
  add(stemOf("Chess") + ".mp4");
  for (int number = 2; number < 100; ++number) add(stemOf("Chess") + " " + std::to_string(number) + ".mp4");
  salvage();
  add("Chess.mp4");
  salvage();
  EXPECT_EQ(salvage_.salvaged, std::vector<std::string>{stemOf("Chess") + " 100.mp4"});
  EXPECT_TRUE(disk_.itemExists(std::string(kMoviesStore) + "Chess.mp4"));
}

/// Whatever it holds, the next recording of that application would replace it.
TEST_F(UnfinishedMoviesTest, WhatIsDamagedIsKeptUnderANameOfItsOwn) {
  add("Broken.mp4");
  salvage_.damaged = {"Broken.mp4"};
  salvage();
  const auto kept = names();
  const auto broken =
      std::ranges::find_if(kept, [](const auto& name) { return name.starts_with("Broken_recovered_"); });
  ASSERT_NE(broken, kept.end());
  EXPECT_EQ(disk_.readFile(kMoviesStore + *broken).value(), "Broken.mp4");
  EXPECT_EQ(log_.countContaining("\"" + *broken + "\""), 1u);
  EXPECT_EQ(kept.size(), 6u);
}

TEST_F(UnfinishedMoviesTest, AStoreThatCannotBeReadCostsALogLine) {
  disk_.failOn(fakes::ScratchDisk::Operation::List, kMoviesStore, EIO);
  salvage();
  EXPECT_EQ(log_.lines().size(), 1u);
  EXPECT_TRUE(salvage_.salvaged.empty());
}

}  // namespace
}  // namespace qv
