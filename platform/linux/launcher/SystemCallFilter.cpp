#include "platform/linux/launcher/SystemCallFilter.h"

#include <fcntl.h>
#include <linux/netlink.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/personality.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <system_error>
#include <vector>

#include "platform/linux/launcher/SystemCallLists.h"

namespace qv::platform::launcher {
namespace {

constexpr uint32_t kRefused = SCMP_ACT_ERRNO(EPERM);

void check(int result) {
  if (result < 0) throw std::system_error(-result, std::generic_category(), "system call filter");
}

/// That an argument has these bits, of those in `mask`. Its low half counts: it is an int in the kernel, and what
/// stands above that in the register is left to chance.
struct Condition {
  unsigned argument;
  uint32_t bits;
  uint32_t mask = ~0u;
};

/// What no rule is for does not exist, as does a call of another architecture's table (x32 is one).
///
/// Threading: one thread.
class Filter {
 public:
  Filter() : context_(seccomp_init(SCMP_ACT_ERRNO(ENOSYS))) {
    if (!context_) check(-ENOMEM);
    check(seccomp_attr_set(context_.get(), SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_ERRNO(ENOSYS)));
    // As a tree; one after the other, the last would be asked for after two hundred.
    constexpr uint32_t kBinaryTree = 2;
    (void)seccomp_attr_set(context_.get(), SCMP_FLTATR_CTL_OPTIMIZE, kBinaryTree);
  }
  template <size_t count>
  void addAll(const char* const (&names)[count], uint32_t action) {
    for (const char* name : names) {
      const int call = seccomp_syscall_resolve_name(name);
      if (call != __NR_SCMP_ERROR) add(call, action);
    }
  }
  void add(int call, uint32_t action, std::initializer_list<Condition> conditions = {}) {
    std::vector<scmp_arg_cmp> all;
    for (const Condition& each : conditions) {
      all.push_back({each.argument, SCMP_CMP_MASKED_EQ, each.mask, each.bits});
    }
    check(seccomp_rule_add_array(context_.get(), action, call, static_cast<unsigned>(all.size()), all.data()));
  }
  /// Where an argument is one of `values`, and where it is none of them.
  void addByValue(int call, unsigned argument, const std::vector<uint32_t>& values, uint32_t action,
                  uint32_t otherwise) {
    for (const uint32_t value : values) add(call, action, {{argument, value}});
    addOthers(call, {argument, 0, 0}, values, otherwise);
  }
  void install() { check(seccomp_load(context_.get())); }

  /// A rule cannot say "none of these": it says every beginning in bits that none of them has.
  void addOthers(int call, Condition begin, const std::vector<uint32_t>& values, uint32_t action) {
    if (std::none_of(values.begin(), values.end(),
                     [&](uint32_t value) { return (value & begin.mask) == begin.bits; })) {
      add(call, action, {begin});
    } else if (begin.mask != ~0u) {
      const uint32_t longer = begin.mask >> 1 | 1u << 31;
      addOthers(call, {begin.argument, begin.bits, longer}, values, action);
      addOthers(call, {begin.argument, begin.bits | (longer ^ begin.mask), longer}, values, action);
    }
  }

 private:
  struct Release {
    void operator()(void* context) const { seccomp_release(context); }
  };

  const std::unique_ptr<void, Release> context_;
};

void addSockets(Filter& filter) {
  filter.add(SCMP_SYS(socket), SCMP_ACT_ALLOW, {{0, AF_INET}});
  filter.add(SCMP_SYS(socket), SCMP_ACT_ALLOW, {{0, AF_INET6}});
  filter.add(SCMP_SYS(socket), SCMP_ACT_ALLOW, {{0, AF_NETLINK}, {2, NETLINK_ROUTE}});
  filter.addOthers(SCMP_SYS(socket), {0, 0, 0}, {AF_INET, AF_INET6, AF_NETLINK}, kRefused);
  // One of datagrams could be connected anew, to any local service that takes them.
  constexpr uint32_t kTypeMask = 0xF;
  filter.add(SCMP_SYS(socketpair), SCMP_ACT_ALLOW, {{0, AF_UNIX}, {1, SOCK_STREAM, kTypeMask}});
  filter.add(SCMP_SYS(socketpair), SCMP_ACT_ALLOW, {{0, AF_UNIX}, {1, SOCK_SEQPACKET, kTypeMask}});
}

void addThreads(Filter& filter) {
  // Not clone3: its flags stand in memory, out of a filter's reach; without it the C library takes `clone`.
  filter.add(SCMP_SYS(clone), SCMP_ACT_ALLOW, {{0, CLONE_THREAD, CLONE_THREAD}});
  filter.add(SCMP_SYS(clone), kRefused, {{0, 0, CLONE_THREAD}});
}

/// Files that are made or changed, by their mode: the bits with which others would run as this user.
void addModes(Filter& filter, bool hasOwnUser) {
  constexpr uint32_t kSetIdBits = S_ISUID | S_ISGID;
  const auto add = [&](int call, unsigned argument) {
    filter.add(call, SCMP_ACT_ALLOW, {{argument, 0, kSetIdBits}});
    for (const uint32_t bits : {uint32_t{S_ISUID}, uint32_t{S_ISGID}, kSetIdBits}) {
      filter.add(call, kRefused, {{argument, bits, kSetIdBits}});
    }
  };
  // Not openat2: its mode stands in memory.
  add(SCMP_SYS(open), 2);
  add(SCMP_SYS(openat), 3);
  add(SCMP_SYS(creat), 1);
  if (hasOwnUser) {
    add(SCMP_SYS(chmod), 1);
    add(SCMP_SYS(fchmod), 1);
    add(SCMP_SYS(fchmodat), 2);
  } else {
    // Landlock does not handle these.
    for (const int call : {SCMP_SYS(chmod), SCMP_SYS(fchmod), SCMP_SYS(fchmodat)}) filter.add(call, kRefused);
  }
}

/// Descriptors can be made to send signals to others, too.
void addDescriptorControls(Filter& filter) {
  const std::vector<uint32_t> refused{F_SETOWN, F_SETSIG, 15 /* F_SETOWN_EX */, 1024 /* F_SETLEASE */};
  filter.addByValue(SCMP_SYS(fcntl), 1, refused, kRefused, SCMP_ACT_ALLOW);
  filter.addByValue(SCMP_SYS(fcntl64), 1, refused, kRefused, SCMP_ACT_ALLOW);
  constexpr uint32_t kSetOwner = 0x8901, kSetGroup = 0x8902, kTypeForConsole = 0x541C;
  filter.addByValue(SCMP_SYS(ioctl), 1, {kSetOwner, kSetGroup, TIOCSTI, kTypeForConsole}, kRefused, SCMP_ACT_ALLOW);
}

/// What a process says of itself that loosens nothing.
void addProcessControls(Filter& filter, const std::vector<uint32_t>& self) {
  const std::vector<uint32_t> harmless{
      PR_SET_NAME,         PR_GET_NAME,         PR_GET_DUMPABLE,         PR_GET_PDEATHSIG,   PR_CAPBSET_READ,
      PR_SET_NO_NEW_PRIVS, PR_GET_NO_NEW_PRIVS, PR_GET_SECCOMP,          PR_SET_TIMERSLACK,  PR_GET_TIMERSLACK,
      PR_GET_SECUREBITS,   PR_GET_KEEPCAPS,     PR_GET_THP_DISABLE,      PR_SET_THP_DISABLE, PR_GET_TAGGED_ADDR_CTRL,
      PR_SVE_GET_VL,       PR_PAC_RESET_KEYS,   PR_SET_TAGGED_ADDR_CTRL, 0x53564D41 /* PR_SET_VMA */};
  filter.addByValue(SCMP_SYS(prctl), 0, harmless, SCMP_ACT_ALLOW, kRefused);
  constexpr uint32_t kQuery = ~0u;
  filter.addByValue(SCMP_SYS(personality), 0, {PER_LINUX, ADDR_NO_RANDOMIZE, kQuery}, SCMP_ACT_ALLOW, kRefused);
  filter.addByValue(SCMP_SYS(prlimit64), 0, self, SCMP_ACT_ALLOW, kRefused);
}

/// Of itself alone, in the daemon's user.
void addScheduling(Filter& filter, const std::vector<uint32_t>& self) {
  for (const int call :
       {SCMP_SYS(sched_setaffinity), SCMP_SYS(sched_setattr), SCMP_SYS(sched_setparam), SCMP_SYS(sched_setscheduler)}) {
    filter.addByValue(call, 0, self, SCMP_ACT_ALLOW, kRefused);
  }
  for (const uint32_t who : self) {
    filter.add(SCMP_SYS(setpriority), SCMP_ACT_ALLOW, {{0, PRIO_PROCESS}, {1, who}});
  }
}

void addSignals(Filter& filter, int landlockVersion) {
  constexpr int kVersionWithSignals = 6;
  for (const int call : {SCMP_SYS(kill), SCMP_SYS(tgkill), SCMP_SYS(rt_sigqueueinfo), SCMP_SYS(rt_tgsigqueueinfo)}) {
    if (landlockVersion >= kVersionWithSignals) {
      filter.add(call, SCMP_ACT_ALLOW);
    } else {
      filter.addByValue(call, 0, {static_cast<uint32_t>(::getpid())}, SCMP_ACT_ALLOW, kRefused);
    }
  }
}

void addWhatDependsOnTheUser(Filter& filter, const Confinement& confinement, const std::vector<uint32_t>& self) {
  constexpr int kVersionWithTruncation = 3;
  addModes(filter, confinement.hasOwnUser);
  if (confinement.hasOwnUser) return filter.addAll(kCallsOfAnOwnUser, SCMP_ACT_ALLOW);
  addScheduling(filter, self);
  for (const int call : {SCMP_SYS(utime), SCMP_SYS(utimes), SCMP_SYS(futimesat), SCMP_SYS(utimensat)}) {
    filter.add(call, kRefused);
  }
  const uint32_t truncation = confinement.landlockVersion < kVersionWithTruncation ? kRefused : SCMP_ACT_ALLOW;
  filter.add(SCMP_SYS(truncate), truncation);
  filter.add(SCMP_SYS(truncate64), truncation);
}

}  // namespace

void installSystemCallFilter(const Confinement& confinement) {
  const std::vector<uint32_t> self{0, static_cast<uint32_t>(::getpid())};
  Filter filter;
  filter.addAll(kFileCalls, SCMP_ACT_ALLOW);
  filter.addAll(kEventCalls, SCMP_ACT_ALLOW);
  filter.addAll(kMemoryCalls, SCMP_ACT_ALLOW);
  filter.addAll(kProcessCalls, SCMP_ACT_ALLOW);
  filter.addAll(kSignalCalls, SCMP_ACT_ALLOW);
  filter.addAll(kTimeCalls, SCMP_ACT_ALLOW);
  filter.addAll(kNetworkCalls, SCMP_ACT_ALLOW);
  filter.addAll(kRefusedCalls, kRefused);
  addSockets(filter);
  addThreads(filter);
  addDescriptorControls(filter);
  addProcessControls(filter, self);
  addSignals(filter, confinement.landlockVersion);
  addWhatDependsOnTheUser(filter, confinement, self);
  filter.install();
}

}  // namespace qv::platform::launcher
