#include "platform/linux/launcher/SystemCallFilter.h"

#include <sched.h>
#include <seccomp.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <memory>
#include <system_error>
#include <vector>

namespace qv::platform::launcher {
namespace {

void check(int result) {
  if (result < 0) throw std::system_error(-result, std::generic_category(), "system call filter");
}

/// Allows what it does not refuse. A call of another architecture's table (x32 is one) does not exist.
///
/// Threading: one thread.
class Filter {
 public:
  Filter() : context_(seccomp_init(SCMP_ACT_ALLOW)) {
    if (!context_) check(-ENOMEM);
    check(seccomp_attr_set(context_.get(), SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_ERRNO(ENOSYS)));
  }
  void deny(int call, int failure) { check(seccomp_rule_add(context_.get(), actionFor(failure), call, 0)); }
  /// Where the first argument has these bits, of those in `mask`. Its low half counts: it is an int in the kernel, and
  /// what stands above that in the register is left to chance.
  void denyBits(int call, int failure, uint32_t mask, uint32_t bits) {
    check(seccomp_rule_add(context_.get(), actionFor(failure), call, 1, SCMP_A0(SCMP_CMP_MASKED_EQ, mask, bits)));
  }
  /// Unless the first argument is one of `values`. A rule can only say what is refused: every beginning in bits that
  /// none of them has.
  void denyUnlessArgument(int call, const std::vector<uint32_t>& values, int failure, uint32_t mask = 0,
                          uint32_t begin = 0) {
    if (std::none_of(values.begin(), values.end(), [&](uint32_t value) { return (value & mask) == begin; })) {
      denyBits(call, failure, mask, begin);
    } else if (mask != ~0u) {
      const uint32_t longer = mask >> 1 | 1u << 31;
      denyUnlessArgument(call, values, failure, longer, begin);
      denyUnlessArgument(call, values, failure, longer, begin | (longer ^ mask));
    }
  }
  void install() { check(seccomp_load(context_.get())); }

 private:
  struct Release {
    void operator()(void* context) const { seccomp_release(context); }
  };
  static uint32_t actionFor(int failure) { return SCMP_ACT_ERRNO(static_cast<uint32_t>(failure)); }

  const std::unique_ptr<void, Release> context_;
};

void denyProcesses(Filter& filter) {
  filter.deny(SCMP_SYS(fork), EPERM);
  filter.deny(SCMP_SYS(vfork), EPERM);
  // Its flags stand in memory, out of a filter's reach; without it the C library takes `clone`.
  filter.deny(SCMP_SYS(clone3), ENOSYS);
  filter.denyBits(SCMP_SYS(clone), EPERM, CLONE_THREAD, 0);
}

void denySignalsToOthers(Filter& filter) {
  const std::vector<uint32_t> self{static_cast<uint32_t>(::getpid())};
  for (const int call : {SCMP_SYS(kill), SCMP_SYS(tgkill), SCMP_SYS(rt_sigqueueinfo), SCMP_SYS(rt_tgsigqueueinfo)}) {
    filter.denyUnlessArgument(call, self, EPERM);
  }
  filter.deny(SCMP_SYS(tkill), EPERM);
  filter.deny(SCMP_SYS(pidfd_send_signal), EPERM);
}

}  // namespace

void installSystemCallFilter(int landlockVersion) {
  constexpr int kVersionWithTruncation = 3;
  constexpr int kVersionWithSignals = 6;
  Filter filter;
  filter.denyUnlessArgument(SCMP_SYS(socket), {AF_INET, AF_INET6, AF_NETLINK}, EACCES);
  denyProcesses(filter);
  for (const int call : {SCMP_SYS(io_uring_setup), SCMP_SYS(ptrace), SCMP_SYS(unshare), SCMP_SYS(setns),
                         SCMP_SYS(keyctl), SCMP_SYS(add_key)}) {
    filter.deny(call, EPERM);
  }
  filter.deny(SCMP_SYS(shmget), EACCES);
  filter.deny(SCMP_SYS(shmat), EACCES);
  if (landlockVersion < kVersionWithTruncation) filter.deny(SCMP_SYS(truncate), EACCES);
  if (landlockVersion < kVersionWithSignals) denySignalsToOthers(filter);
  filter.install();
}

}  // namespace qv::platform::launcher
