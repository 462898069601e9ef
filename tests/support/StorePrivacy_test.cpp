#include <sys/stat.h>

#include "tests/support/SupportTest.h"

namespace qv {
namespace {

class StorePrivacyTest : public SupportTest {
 protected:
  struct stat infoOf(const std::string& path) {
    struct stat info {};
    EXPECT_EQ(::lstat(disk_.at(path).c_str(), &info), 0) << path;
    return info;
  }
  unsigned modeOf(const std::string& path) { return infoOf(path).st_mode & 07777; }
  const std::string store_ = files_.pathInStore(".");
  const std::string movie_ = files_.pathInStore("Chess.mp4");
};

TEST_F(StorePrivacyTest, AStoreThatOthersCouldReadIsClosedToThemWithItsMovies) {
  disk_.addDirectory("/root/private/var/mobile/Library");
  files_._srSetupTempDirectory();
  EXPECT_EQ(modeOf(store_), 0700u) << "as it is made";
  ASSERT_EQ(::chmod(disk_.at(store_).c_str(), 0755), 0);
  disk_.addFile(movie_, "movie");
  disk_.addFile("/root/etc/hosts", "not of the store");
  ASSERT_EQ(::symlink("../../../../../etc/hosts", disk_.at(files_.pathInStore("link.mp4")).c_str()), 0);
  // A former user of the daemon's.
  EXPECT_TRUE(::geteuid() != 0 || ::chown(disk_.at(movie_).c_str(), 4711, 4711) == 0);
  files_._srSetupTempDirectory();
  EXPECT_EQ(modeOf(store_), 0700u);
  EXPECT_EQ(modeOf(movie_), 0600u);
  EXPECT_EQ(infoOf(movie_).st_uid, ::geteuid());
  EXPECT_EQ(modeOf("/root/etc/hosts"), 0644u);
  EXPECT_FALSE(log_.contains("others can read the store"));
}

}  // namespace
}  // namespace qv
