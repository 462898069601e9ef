#include "protocol/QVStatusProtocol.h"
#include "support/QVDiskSpace.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using platform::valueForKey;

constexpr uid_t kViewer = 4242, kOther = 4243;

class StatusTest : public QuietDaemonTest {
 protected:
  /// Of somebody in no bundle, who asks several times at once.
  Array ask(uid_t user, const OutgoingCall& call, int times = 1) {
    platform::IPCPeer peer;
    peer.processIdentifier = 900;
    peer.userIdentifier = user;
    device_.ipc.setClientPeer(peer);
    const auto connection = *device_.ipc.connect(kServiceName);
    connection->setRemoteInterface(statusProtocol());
    connection->resume();
    std::vector<Value> answers;
    for (int i = 0; i < times; ++i) {
      connection->call(call.member, call.arguments, [&](const auto& values) { answers.push_back(values.at(0)); }, {});
    }
    device_.run();
    EXPECT_EQ(answers.size(), static_cast<size_t>(times));
    return answers.empty() ? Array() : answers[0].asArray();
  }
  /// The code with which a start would be refused; 0 for none.
  int64_t refusal(const std::string& bundleID, bool system) {
    status::GetStartConditions call;
    call.bundleID = bundleID;
    call.systemRecording = system;
    for (const Value& each : ask(0, call)) {
      if (const Value code = valueForKey(each.asDictionary(), "code"); !code.isNone()) return code.asInteger();
    }
    return 0;
  }
};

TEST_F(StatusTest, WhatIsRecordedIsToldToItsUserAndToOthersThatItIs) {
  auto client = gameOf(kViewer);
  ASSERT_EQ(client.start()->code(), 0);
  sendFrame(kSecond);
  sendFrame(3 * kSecond);
  device_.movies.last().counts->dropped = 3;
  for (const uid_t user : {kViewer, uid_t{0}}) {
    const Array all = ask(user, status::GetRecordings{});
    ASSERT_EQ(all.size(), 1U);
    Dictionary own = all[0].asDictionary();
    EXPECT_EQ(own["bundleIdentifier"], Value("com.example.game"));
    EXPECT_EQ(own["videoEncoder"], Value("fake264"));
    EXPECT_EQ((std::tuple{own["pictures"].asInteger(), own["droppedPictures"].asInteger(), own["seconds"].asDouble()}),
              (std::tuple{2, 3, 2.0}));
  }
  client.send("pauseRecording");
  Dictionary seen = ask(kOther, status::GetRecordings{}).at(0).asDictionary();
  EXPECT_EQ(seen["state"], Value("paused"));
  for (const char* open : {"kind", "systemRecording", "state", "since"}) EXPECT_EQ(seen.erase(open), 1U) << open;
  EXPECT_TRUE(seen.empty());
  client.stop();
  EXPECT_EQ(device_.metrics.messages.back().droppedPictures, 3U) << "the event of its end has them, too";
  EXPECT_TRUE(ask(0, status::GetRecordings{}).empty());
  EXPECT_EQ(valueForKey(ask(kViewer, status::GetMovies{}).at(0).asDictionary(), "state"), Value("waiting"));
  EXPECT_TRUE(ask(kOther, status::GetMovies{}).empty());
}

TEST_F(StatusTest, PicturesThatAClientIsTooSlowForAreCounted) {
  auto client = gameOf(kViewer);
  ASSERT_EQ(client.start({.capture = true})->code(), 0);
  sendFrame(kSecond);
  client.fallBehind();
  sendFrame(2 * kSecond);
  sendFrame(3 * kSecond);
  Dictionary seen = ask(kViewer, status::GetRecordings{}).at(0).asDictionary();
  EXPECT_EQ((std::pair{seen["pictures"].asInteger(), seen["droppedPictures"].asInteger()}), (std::pair{3L, 2L}));
}

TEST_F(StatusTest, AStartIsRefusedAsItsConditionsTell) {
  auto client = game();
  auto system = systemUI();
  device_.entitlements.all["com.example.system"] = {{kSystemClientEntitlement, true}};
  const auto expectBoth = [&](int64_t ofGame, int64_t ofSystem, const char* when) {
    EXPECT_EQ(refusal("com.example.game", false), ofGame) << when;
    EXPECT_EQ(client.start()->code(), ofGame) << when;
    EXPECT_EQ(refusal("com.example.system", true), ofSystem) << when;
    EXPECT_EQ(system.start({.system = true})->code(), ofSystem) << when;
  };
  expectBoth(0, 0, "as it should be");
  device_.disk.setFreeSize(kMinimumFreeSpaceForRecording);
  expectBoth(errorcode::kInsufficientStorage, errorcode::kInsufficientStorage, "on a full disk");
  device_.disk.setFreeSize(kMinimumFreeSpaceForRecording + 1);
  device_.applications.states["com.example.game"] = platform::kApplicationBackground;
  expectBoth(errorcode::kFailedToStart, 0, "in the background");
  EXPECT_EQ(refusal("com.example.game", true), errorcode::kEntitlements);
  EXPECT_EQ(client.start({.system = true})->code(), errorcode::kEntitlements);
}

TEST_F(StatusTest, ManyQuestionsAreOneLookAtTheServices) {
  ask(kViewer, status::GetDevice{}, 5);
  EXPECT_EQ(device_.services.looks, 1);
}

}  // namespace
}  // namespace qv
