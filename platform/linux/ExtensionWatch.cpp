#include "platform/linux/ExtensionWatch.h"

#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string>

#include "platform/linux/ExtensionBounds.h"

namespace qv::platform {
namespace {

constexpr size_t kOutputAtOnce = size_t{64} << 10;  // bytes, what a pipe holds
/// Between two of these: a megabyte a second, after which whoever writes more has to wait.
constexpr std::chrono::milliseconds kOutputInterval{60};
/// Counting takes at most so much of a processor.
constexpr int kCountShare = 20;  // one part of

bool isReady(const pollfd& watched) { return watched.revents != 0; }

}  // namespace

ExtensionWatch::ExtensionWatch(const SpawnedProcess& process, const SpawnedProcess& guard, ExtensionLaunch& launch,
                               const std::function<void(const Error&)>& willKill)
    : process_(process), guard_(guard), launch_(launch), willKill_(willKill) {
  using namespace extensionbounds;
  const ContainerUse now = countContainerUse(launch_.container, process_.processIdentifier());
  bound_ = {std::clamp(now.bytes, kContainerBytes, 2 * kContainerBytes),
            std::clamp(now.entries, kContainerEntries, 2 * kContainerEntries)};
  nextCount_ = nextOutput_ = Clock::now();
}

int ExtensionWatch::waitForEnd() {
  pollfd watched[] = {{process_.handle(), POLLIN, 0}, {guard_.handle(), POLLIN, 0}, {-1, POLLIN, 0}};
  while (true) {
    const bool takesOutput = launch_.output.isValid() && Clock::now() >= nextOutput_;
    watched[2].fd = takesOutput ? launch_.output.get() : -1;
    const auto until = launch_.output.isValid() && !takesOutput ? std::min(nextCount_, nextOutput_) : nextCount_;
    const auto wait = std::chrono::ceil<std::chrono::milliseconds>(until - Clock::now()).count();
    if (::poll(watched, 3, static_cast<int>(std::max<int64_t>(wait, 0))) < 0) continue;
    if (isReady(watched[0])) break;
    // The guard goes with the process, too.
    if (isReady(watched[1]) && ::poll(watched, 1, 0) == 0) kill(Error::posix(ECHILD, "its guard has ended"));
    if (isReady(watched[1])) break;
    if (isReady(watched[2])) takeOutput();
    if (Clock::now() >= nextCount_) countContainer();
  }
  const int status = process_.waitForEnd();
  takeAllOutput();
  return status;
}

void ExtensionWatch::countContainer() {
  const auto begin = Clock::now();
  const ContainerUse use = countContainerUse(launch_.container, process_.processIdentifier());
  const auto end = Clock::now();
  nextCount_ = end + std::max<Clock::duration>(extensionbounds::kContainerCountInterval, kCountShare * (end - begin));
  if (use.bytes > bound_.bytes) {
    kill(Error::posix(EDQUOT, "its container has " + std::to_string(use.bytes >> 20) + " MiB, and may have " +
                                  std::to_string(bound_.bytes >> 20)));
  } else if (use.entries > bound_.entries) {
    kill(Error::posix(EDQUOT, "its container has more than " + std::to_string(bound_.entries) + " entries"));
  }
}

void ExtensionWatch::takeOutput() {
  (void)takeOneOutput();
  nextOutput_ = Clock::now() + kOutputInterval;
}

/// Once nobody writes any more.
void ExtensionWatch::takeAllOutput() {
  while (launch_.output.isValid() && takeOneOutput()) {
  }
}

bool ExtensionWatch::takeOneOutput() {
  char text[kOutputAtOnce];
  const ssize_t count = ::read(launch_.output.get(), text, sizeof text);
  if (count < 0) return errno == EINTR;
  if (count == 0) launch_.output.reset();
  launch_.log.write({text, static_cast<size_t>(count)});
  return count > 0;
}

void ExtensionWatch::kill(const Error& why) {
  if (std::exchange(isKilled_, true)) return;
  willKill_(why);
  process_.sendSignal(SIGKILL);
}

}  // namespace qv::platform
