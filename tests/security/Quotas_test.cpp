#include <sys/stat.h>

#include <atomic>

#include "tests/security/AttackTest.h"

namespace qv::security {
namespace {

using Clock = std::chrono::steady_clock;

class QuotasTest : public AttackTest {
 protected:
  explicit QuotasTest(platform::SdBusIPCOptions options = {}) : AttackTest(forAnybody(std::move(options))) {
    ::chmod(directory_.c_str(), 0755);
  }
  static platform::SdBusIPCOptions forAnybody(platform::SdBusIPCOptions options) {
    options.unfinishedMilliseconds = std::chrono::milliseconds(10 * kit::kNever).count();
    if (::getuid() == 0) options.socketGroup = std::to_string(kSomebody);
    return options;
  }
  static size_t dropped(std::vector<Attacker>& attackers) {
    return static_cast<size_t>(std::ranges::count_if(attackers, [](Attacker& each) { return each.wasDropped(); }));
  }
};

class FloodTest : public QuotasTest {
 protected:
  FloodTest() : QuotasTest(options()) {}
  static platform::SdBusIPCOptions options() {
    platform::SdBusIPCOptions options;
    options.quotas.connectionsPerSecond = 1e6;  // it is their number that is asked for here
    return options;
  }
};

TEST_F(FloodTest, OneUsersConnectionsShutNobodyOut) {
  if (::getuid() != 0) GTEST_SKIP() << "only root can be somebody else";
  const auto honest = connectEcho();
  const auto served = delegate_.connections.next();
  const fakes::LogRecorder log;
  const auto start = Clock::now();
  constexpr size_t kFlood = 600;
  constexpr size_t kQuota = 256;
  for (int round = 0; round < 2; ++round) {
    std::vector<Attacker> flood;
    asSomebody([&] {
      for (size_t i = 0; i < kFlood; ++i) EXPECT_TRUE(flood.emplace_back(path()).isConnected());
    });
    const auto another = connectClient();  // accepted after all of them
    expectService(*another);
    expectService(*honest);
    EXPECT_EQ(dropped(flood), kFlood - kQuota) << "round " << round;
    flood.clear();
    for (size_t i = 0; i < kQuota; ++i) EXPECT_EQ(delegate_.ended.next(), "invalidated");
    another->invalidate();
    EXPECT_EQ(delegate_.ended.next(), "invalidated");
    delegate_.connections.clear();
    expectService(*honest);
  }
  const auto seconds = std::chrono::ceil<std::chrono::seconds>(Clock::now() - start).count();
  EXPECT_GE(log.countContaining("too many connections of this user"), 1u);
  EXPECT_LE(log.countContaining("too many connections of this user"), static_cast<size_t>(seconds) + 1);
}

TEST_F(QuotasTest, UnfinishedMessagesHaveABoundTogether) {
  const auto honest = connectEcho();
  const fakes::LogRecorder log;
  // All but the last byte of a call of nearly 2 MiB.
  std::string large = rawCall(testInterface().name, "sample", "uay", "\1\0\0\0"s + std::string((2 << 20) - 1024, 'x'));
  large.pop_back();
  std::vector<Attacker> attackers;
  size_t taken = 0;
  for (int i = 0; i < 40; ++i) {
    attackers.emplace_back(path()).authenticate();
    taken += attackers.back().send(large);
  }
  // 8 MiB are four of them; what the kernel holds of the last ones is not read any more.
  size_t held = attackers.size();
  while (held > 4) {
    expectService(*honest);
    held = attackers.size() - dropped(attackers);
  }
  EXPECT_EQ(held, 4u);
  EXPECT_LT(taken, attackers.size());
  EXPECT_GE(log.countContaining("too much that is unfinished"), 1u);
  expectService(*honest);
}

class BusyTest : public QuotasTest {
 protected:
  BusyTest() : QuotasTest(options()) {}
  static platform::SdBusIPCOptions options() {
    platform::SdBusIPCOptions options;
    options.quotas.callsAtOnce = 20;
    options.quotas.callsPerSecond = 1000;
    return options;
  }
};

TEST_F(BusyTest, CallsBeyondTheQuotaComeLaterAndAnotherUsersAtOnce) {
  if (::getuid() != 0) GTEST_SKIP() << "only root can be somebody else";
  constexpr size_t kCalls = 300;
  kit::Events<bool> allCame;
  std::atomic<size_t> notified{0};
  delegate_.object->answer = [&](const platform::test::Call& received) {
    if (received.member == "notify" && ++notified == 2 * kCalls) allCame.add(true);
    echo(received);
  };
  listen();
  const auto honest = connectClient();
  std::string calls;
  for (size_t i = 0; i < kCalls; ++i) calls += rawCall(testInterface().name, "notify", "u", "\1\0\0\0"s, 1);
  const auto start = Clock::now();
  asSomebody([&] {
    // Two connections do not have more than one; what is sent before the end is read after it too.
    Attacker first(path());
    Attacker second(path());
    for (Attacker* each : {&first, &second}) {
      each->authenticate();
      EXPECT_TRUE(each->send(calls));
    }
  });
  expectService(*honest);
  EXPECT_TRUE(allCame.next());
  EXPECT_GE(Clock::now() - start, std::chrono::milliseconds(2 * kCalls - 20 - 2));
}

}  // namespace
}  // namespace qv::security
