#include <chrono>
#include <cstdio>
#include <cstdlib>

#include "tests/daemon/RandomDriver.h"

namespace qv {
namespace {

constexpr int kSteps = 4000;
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int kRuns = 6;
#else
constexpr int kRuns = 24;
#endif

uint64_t numberFrom(const char* variable, uint64_t otherwise) {
  const char* text = std::getenv(variable);
  return text ? std::strtoull(text, nullptr, 10) : otherwise;
}

TEST(RandomRecordings, LoseNothingAndLeaveNothing) {
  const uint64_t seconds = numberFrom("QUORVEL_RANDOM_SECONDS", 0);
  const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(seconds);
  const uint64_t first = numberFrom("QUORVEL_RANDOM_SEED", 1);
  std::printf("QUORVEL_RANDOM_SEED=%llu\n", static_cast<unsigned long long>(first));
  std::fflush(stdout);
  uint64_t seed = first;
  size_t checks = 0;
  while (seed < first + kRuns || std::chrono::steady_clock::now() < end) {
    RandomDriver driver(seed++);
    const bool holds = driver.run(kSteps) && driver.finish();
    ASSERT_TRUE(holds) << driver.report();
    checks += driver.certainChecks();
  }
  EXPECT_GT(checks, (seed - first) * kSteps / 200) << "too much was in doubt for anything to be checked";
}

}  // namespace
}  // namespace qv
