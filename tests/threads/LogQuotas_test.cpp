#include "platform/threads/LogQuotas.h"

#include <gtest/gtest.h>

#include "platform/threads/Log.h"
#include "tests/fakes/LogRecorder.h"

namespace qv::platform {
namespace {

TEST(LogQuotasTest, OneUserFillsNoLogAndHidesNothing) {
  fakes::LogRecorder log;
  LogQuotas quotas;
  const auto write = [&](int count, const char* line) {
    for (int i = 0; i < count; ++i) QV_LOG(logs::kDaemon, "%s", line);
  };
  {
    const LogQuotas::Scope greedy(quotas, 1001);
    write(100'000, "greedy");
    {
      const LogQuotas::Scope other(quotas, 1002);
      write(500, "other");
    }
    write(1000, "greedy");
  }
  write(500, "the service's own");
  EXPECT_GE(log.countContaining("greedy"), 1000u);
  EXPECT_LT(log.countContaining("greedy"), 50'000u);
  EXPECT_EQ(log.countContaining("other"), 500u);
  EXPECT_EQ(log.countContaining("the service's own"), 500u);
}

}  // namespace
}  // namespace qv::platform
