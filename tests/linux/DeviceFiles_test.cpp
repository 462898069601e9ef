#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <vector>

#include "platform/linux/DeviceDescription.h"
#include "platform/linux/EntitlementStore.h"
#include "platform/linux/JSONPreferenceStore.h"
#include "platform/linux/ProcessScreenReader.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

class DeviceFilesTest : public testing::Test {
 protected:
  kit::ScratchFolder root_;
  fakes::LogRecorder log_;
};

TEST_F(DeviceFilesTest, PreferencesAreReadAtEachUse) {
  JSONPreferenceStore store(root_.path("/Preferences"));
  const auto value = [&] { return store.valueForKey("com.tarnwick.quorveld", "QVFullResCapture"); };
  const std::string path = "/Preferences/com.tarnwick.quorveld.json";
  EXPECT_TRUE(value().isNone());
  root_.write(path, R"({"QVFullResCapture": true})");
  EXPECT_EQ(value(), Value(true));
  EXPECT_TRUE(log_.lines().empty());
  for (const char* broken : {"{\"QVFullResCapture\": tru", "[true]", ""}) {
    log_.clear();
    root_.write(path, broken);
    EXPECT_TRUE(value().isNone());
    EXPECT_EQ(log_.countContaining("preferences"), 1u) << broken;
  }
  root_.write("/secret.json", R"({"QVFullResCapture": true})");
  EXPECT_TRUE(store.valueForKey("../secret", "QVFullResCapture").isNone());
}

TEST_F(DeviceFilesTest, DescribesTheDeviceOrAPlainTelevisionBox) {
  const struct {
    const char* content;
    UserInterfaceIdiom idiom;
    int64_t chip;
    bool hasCapture, isInternal, clicks;
    size_t complaints;
  } cases[] = {
      {"", UserInterfaceIdiom::Television, 0, false, false, false, 0},
      {"{", UserInterfaceIdiom::Television, 0, false, false, false, 1},
      {"[]", UserInterfaceIdiom::Television, 0, false, false, false, 1},
      {R"({"idiom": "tablet", "chipID": 32784, "audioCaptureDevice": true, "RegionalBehaviorShutterClick": true,
           "internalBuild": true})",
       UserInterfaceIdiom::Tablet, 32784, true, true, true, 0},
      {R"({"idiom": "toaster", "chipID": "7", "audioCaptureDevice": 1, "internalBuild": "yes", "Name": {},
           "RegionalBehaviorShutterClick": true})",
       UserInterfaceIdiom::Television, 0, false, false, true, 5},
  };
  for (const auto& c : cases) {
    if (*c.content != '\0') root_.write("/etc/quorvel/device.json", c.content);
    DeviceDescription device(root_.path());
    EXPECT_EQ(device.userInterfaceIdiom(), c.idiom) << c.content;
    EXPECT_EQ(device.integerProperty("ChipID"), c.chip) << c.content;
    EXPECT_EQ(device.hasAudioCaptureDevice(), c.hasCapture) << c.content;
    EXPECT_EQ(device.allowsInternalSecurityPolicies("com.tarnwick.quorveld"), c.isInternal) << c.content;
    EXPECT_EQ(device.booleanProperty("RegionalBehaviorShutterClick"), c.clicks) << c.content;
    EXPECT_EQ(log_.lines().size(), c.complaints) << c.content;
    log_.clear();
  }
}

class EntitlementsTest : public DeviceFilesTest {
 protected:
  EntitlementsTest() {
    std::filesystem::create_directories(root_.path(kDirectory));
    file_ = root_.write(kDirectory + "/com.example.remote.json", R"({"com.tarnwick.private.quorvel": true})");
    setMode(0644);
  }
  void setMode(mode_t mode) { ASSERT_EQ(::chmod(file_.c_str(), mode), 0); }
  Dictionary entitlements(const std::string& identifier = "com.example.remote") {
    return EntitlementStore(root_.path(), kSessionUser).entitlementsForBundle(identifier, user_);
  }
  static inline const std::string kDirectory = "/etc/quorvel/entitlements";
  static constexpr uid_t kSessionUser = 1000;
  uid_t user_ = kSessionUser;
  std::string file_;
};

TEST_F(EntitlementsTest, HoldForTheUsersThatTheyName) {
  constexpr uid_t kDaemonAccount = 1;  // "daemon", on every Debian
  const auto holders = [&](const std::string& users) {
    root_.write(kDirectory + "/com.example.remote.json", R"({"com.tarnwick.private.quorvel": true)" + users + "}");
    std::vector<uid_t> found;
    for (const uid_t user : {uid_t{0}, kDaemonAccount, kSessionUser, uid_t{1001}}) {
      user_ = user;
      const Dictionary granted = entitlements();
      if (!granted.empty()) found.push_back(user);
      EXPECT_FALSE(granted.contains("users"));
    }
    return found;
  };
  using Users = std::vector<uid_t>;
  EXPECT_EQ(holders(""), (Users{0, kSessionUser}));
  EXPECT_EQ(holders(R"(, "users": ["session", 1001])"), (Users{kSessionUser, 1001}));
  EXPECT_EQ(holders(R"(, "users": ["daemon", "1001"])"), (Users{kDaemonAccount, 1001}));
  EXPECT_EQ(holders(R"(, "users": [])"), Users{});
  EXPECT_EQ(log_.countContaining("nobody"), 0u);
  EXPECT_EQ(holders(R"(, "users": [-1, 4294967295, true, "no such user", 0.5, 0])"), Users{0});
  EXPECT_EQ(log_.countContaining("name a user who is nobody: \"no such user\""), 4u);
  EXPECT_EQ(holders(R"(, "users": "session")"), Users{});
  EXPECT_EQ(log_.countContaining("\"users\" is no array"), 4u);
}

TEST_F(EntitlementsTest, IdentifiersCannotLeaveTheDirectory) {
  root_.write("/etc/quorvel/outside.json", R"({"com.tarnwick.private.quorvel": true})");
  EXPECT_EQ(entitlements(), (Dictionary{{"com.tarnwick.private.quorvel", Value(true)}}));
  for (const char* identifier :
       {"com.example.other", "../outside", "..", "", ".", "a/../com.example.remote", "com.example.remote\n"}) {
    EXPECT_TRUE(entitlements(identifier).empty()) << identifier;
  }
}

TEST_F(EntitlementsTest, FilesThatOthersCouldHaveWrittenGrantNothing) {
  for (const mode_t mode : {0664u, 0646u}) {
    setMode(mode);
    EXPECT_TRUE(entitlements().empty());
  }
  setMode(0644);
  ASSERT_EQ(::chmod(root_.path(kDirectory).c_str(), 0777), 0);
  EXPECT_TRUE(entitlements().empty());
  ASSERT_EQ(::chmod(root_.path(kDirectory).c_str(), 0755), 0);
  std::filesystem::create_symlink(file_, root_.path(kDirectory + "/com.example.link.json"));
  EXPECT_TRUE(entitlements("com.example.link").empty());
  std::filesystem::create_directory(root_.path(kDirectory + "/com.example.folder.json"));
  EXPECT_TRUE(entitlements("com.example.folder").empty());
  EXPECT_EQ(log_.countContaining("are ignored"), 5u);
  if (::geteuid() == 0) {
    ASSERT_EQ(::chown(file_.c_str(), 1, 1), 0);
    EXPECT_TRUE(entitlements().empty());
  }
}

TEST(ProcessScreenReaderTest, IsKnownByTheNameOfItsProcess) {
  const std::string own = "linux_tests";
  EXPECT_TRUE(ProcessScreenReader({"nobody-has-this", own}).isRunning());
  EXPECT_FALSE(ProcessScreenReader({"nobody-has-this", own + "2"}).isRunning());
}

}  // namespace
}  // namespace qv::platform
