#include "support/QVUnfinishedMovies.h"

#include <cerrno>

#include "tests/fakes/FakeMovieSalvage.h"
#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using platform::MovieState;

constexpr const char kStore[] = "/root/private/var/mobile/Library/Quorvel/";

class UnfinishedMoviesTest : public SupportTest {
 protected:
  UnfinishedMoviesTest() {
    platform_.movieSalvage = &salvage_;
    for (const char* name : {"Chess.mp4", "Done.mp4", "Live.mp4", "text.mp4", "Chess.mp4.7-1.partial"}) add(name);
    salvage_.states = {
        {"Chess.mp4", MovieState::Unfinished}, {"Done.mp4", MovieState::Finished}, {"Live.mp4", MovieState::InUse}};
  }
  void add(const std::string& name) { disk_.addFile(kStore + name, name, {fakes::FakeClock::kStart}); }
  std::vector<std::string> names() { return disk_.contentsOfDirectory(kStore).value(); }

  fakes::FakeMovieSalvage salvage_;
};

TEST_F(UnfinishedMoviesTest, AreFinishedUnderANameThatNoRecordingTakes) {
  QVUnfinishedMovies(files_, *platform_.movieSalvage, localization_)._srSalvageUnfinishedMovies();
  ASSERT_EQ(salvage_.salvaged.size(), 1u);
  const std::string kept = salvage_.salvaged.front();
  EXPECT_TRUE(kept.starts_with("Chess_recovered_") && kept.ends_with(".mp4")) << kept;
  EXPECT_EQ(kept.find(':'), std::string::npos);
  EXPECT_EQ(names(), (std::vector<std::string>{"Chess.mp4.7-1.partial", kept, "Done.mp4", "Live.mp4", "text.mp4"}));

  // The same application crashed at the same moment of a clock that had begun anew.
  add("Chess.mp4");
  QVUnfinishedMovies(files_, *platform_.movieSalvage, localization_)._srSalvageUnfinishedMovies();
  ASSERT_EQ(salvage_.salvaged.size(), 2u);
  EXPECT_NE(salvage_.salvaged.back(), kept);

  // One that a full disk kept from being finished is tried again, under the name that it has.
  salvage_.states[kept] = MovieState::Unfinished;
  salvage_.length = platform::Error::posix(ENOSPC, "disk");
  const auto before = names();
  QVUnfinishedMovies(files_, *platform_.movieSalvage, localization_)._srSalvageUnfinishedMovies();
  EXPECT_EQ(salvage_.salvaged.back(), kept);
  EXPECT_EQ(names(), before);

  salvage_.length = platform::MediaTime::zero();
  QVUnfinishedMovies(files_, *platform_.movieSalvage, localization_)._srSalvageUnfinishedMovies();
  EXPECT_FALSE(disk_.itemExists(kStore + kept));
}

TEST_F(UnfinishedMoviesTest, AStoreThatCannotBeReadCostsALogLine) {
  disk_.failOn(fakes::ScratchDisk::Operation::List, kStore, EIO);
  QVUnfinishedMovies(files_, *platform_.movieSalvage, localization_)._srSalvageUnfinishedMovies();
  EXPECT_EQ(log_.lines().size(), 1u);
  EXPECT_TRUE(salvage_.salvaged.empty());
}

}  // namespace
}  // namespace qv
