#include "platform/sdbus/UserQuotas.h"

#include <gtest/gtest.h>

namespace qv::platform::test {
namespace {

using namespace std::chrono_literals;
using sdbus::QuotaShare;
using sdbus::UserQuota;
using Kind = QuotaShare::Kind;

const UserQuota::Time kStart = UserQuota::Time() + 1h;
constexpr IPCQuotas kBounds{
    .connections = 3, .connectionsPerSecond = 2, .unfinishedBytes = 100, .callsPerSecond = 100, .callsAtOnce = 10};

std::unique_ptr<QuotaShare> connect(const std::shared_ptr<UserQuota>& quota, UserQuota::Time now) {
  return QuotaShare::take(quota, Kind::Connection, now);
}

TEST(UserQuotasTest, ConnectionsComeBackButNotFasterThanTheyMay) {
  sdbus::UserQuotas quotas(kBounds);
  const auto quota = quotas.of(1000, kStart);
  std::vector<std::unique_ptr<QuotaShare>> shares;
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(shares.emplace_back(connect(quota, kStart)));
  EXPECT_FALSE(connect(quota, kStart + 10s));
  EXPECT_TRUE(connect(quotas.of(1001, kStart), kStart)) << "another user's";
  const auto root = quotas.of(0, kStart);
  for (int i = 0; i < 9; ++i) EXPECT_TRUE(shares.emplace_back(connect(root, kStart)));
  shares.clear();
  EXPECT_TRUE(connect(quota, kStart + 10s));
  for (int i = 0; i < 2; ++i) EXPECT_TRUE(connect(quota, kStart + 10s));
  EXPECT_FALSE(connect(quotas.of(1000, kStart + 10s), kStart + 10s + 400ms)) << "two a second";
  EXPECT_TRUE(connect(quota, kStart + 10s + 600ms));
}

TEST(UserQuotasTest, BytesAreOfAllConnectionsTogether) {
  sdbus::UserQuotas quotas(kBounds);
  const auto quota = quotas.of(0, kStart);
  auto first = QuotaShare::take(quota, Kind::Bytes, kStart);
  const auto second = connect(quota, kStart);
  EXPECT_TRUE(first->holdBytes(70));
  EXPECT_TRUE(second->holdBytes(30));
  EXPECT_FALSE(second->holdBytes(31));
  EXPECT_TRUE(first->holdBytes(10));
  EXPECT_TRUE(second->holdBytes(90));
  first.reset();
  EXPECT_TRUE(second->holdBytes(100));
}

TEST(UserQuotasTest, CallsThatWereTakenTooEarlyAreWaitedFor) {
  UserQuota quota(1000, kBounds, kStart);
  for (int i = 0; i < 10; ++i) {
    EXPECT_TRUE(quota.mayCall(kStart));
    quota.countCall(kStart);
  }
  EXPECT_FALSE(quota.mayCall(kStart));
  EXPECT_EQ(quota.pause(kStart), 50ms) << "not a wake-up for each call";
  for (int i = 0; i < 10; ++i) quota.countCall(kStart);
  EXPECT_EQ(quota.pause(kStart), 110ms);
  EXPECT_FALSE(quota.mayCall(kStart + 100ms));
  EXPECT_TRUE(quota.mayCall(kStart + 111ms));
  EXPECT_FALSE(quota.isIdle(kStart + 111ms));
  EXPECT_TRUE(quota.isIdle(kStart + 1s));
}

}  // namespace
}  // namespace qv::platform::test
