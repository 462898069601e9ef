#include "platform/linux/launcher/SystemCallFilter.h"

#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <system_error>
#include <vector>

namespace qv::platform::launcher {
namespace {

#if defined(__x86_64__)
constexpr uint32_t kArchitecture = AUDIT_ARCH_X86_64;
#elif defined(__aarch64__)
constexpr uint32_t kArchitecture = AUDIT_ARCH_AARCH64;
#elif defined(__arm__)
constexpr uint32_t kArchitecture = AUDIT_ARCH_ARM;
#elif defined(__riscv) && __riscv_xlen == 64
constexpr uint32_t kArchitecture = AUDIT_ARCH_RISCV64;
#else
#error "the system calls of this architecture are not known here"
#endif

/// The program, as it is put together. The system call's number stands in the accumulator between the parts.
///
/// Threading: one thread.
class Filter {
 public:
  Filter() {
    load(offsetof(seccomp_data, arch));
    compare(kArchitecture, 1, 0);
    refuse(ENOSYS);
    load(offsetof(seccomp_data, nr));
#if defined(__x86_64__)
    // The same calls under other numbers.
    add(BPF_JMP | BPF_JGE | BPF_K, 0x40000000, 0, 1);
    refuse(ENOSYS);
#endif
  }
  void deny(long call, int failure) {
    compare(static_cast<uint32_t>(call), 0, 1);
    refuse(failure);
  }
  /// Unless the first argument is one of `values`.
  void denyUnlessArgument(long call, const std::vector<uint32_t>& values, int failure) {
    const auto count = static_cast<uint8_t>(values.size());
    compare(static_cast<uint32_t>(call), 0, static_cast<uint8_t>(count + 3));
    loadArgument();
    for (uint8_t i = 0; i < count; ++i) compare(values[i], static_cast<uint8_t>(count - i), 0);
    refuse(failure);
    load(offsetof(seccomp_data, nr));
  }
  /// Unless the bit `flag` is set in the first argument.
  void denyUnlessFlag(long call, uint32_t flag, int failure) {
    compare(static_cast<uint32_t>(call), 0, 4);
    loadArgument();
    add(BPF_JMP | BPF_JSET | BPF_K, flag, 1, 0);
    refuse(failure);
    load(offsetof(seccomp_data, nr));
  }
  void install() {
    add(BPF_RET | BPF_K, SECCOMP_RET_ALLOW, 0, 0);
    const sock_fprog program{static_cast<unsigned short>(code_.size()), code_.data()};
    if (::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) != 0) {
      throw std::system_error(errno, std::generic_category(), "system call filter");
    }
  }

 private:
  void add(int operation, uint32_t operand, uint8_t ifTrue, uint8_t ifFalse) {
    code_.push_back({static_cast<uint16_t>(operation), ifTrue, ifFalse, operand});
  }
  void load(size_t offset) { add(BPF_LD | BPF_W | BPF_ABS, static_cast<uint32_t>(offset), 0, 0); }
  /// The low half, on the little-endian machines above; what is compared here is an int in the kernel.
  void loadArgument() { load(offsetof(seccomp_data, args)); }
  /// Skips so many instructions where the accumulator equals `value`, and so many otherwise.
  void compare(uint32_t value, uint8_t ifEqual, uint8_t otherwise) {
    add(BPF_JMP | BPF_JEQ | BPF_K, value, ifEqual, otherwise);
  }
  void refuse(int failure) { add(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | static_cast<uint32_t>(failure), 0, 0); }

  std::vector<sock_filter> code_;
};

void denyProcesses(Filter& filter) {
#ifdef SYS_fork
  filter.deny(SYS_fork, EPERM);
  filter.deny(SYS_vfork, EPERM);
#endif
  // Its flags stand in memory, out of a filter's reach; without it the C library takes `clone`.
  filter.deny(SYS_clone3, ENOSYS);
  filter.denyUnlessFlag(SYS_clone, CLONE_THREAD, EPERM);
}

void denySignalsToOthers(Filter& filter) {
  const std::vector<uint32_t> self{static_cast<uint32_t>(::getpid())};
  for (const long call : {SYS_kill, SYS_tgkill, SYS_rt_sigqueueinfo, SYS_rt_tgsigqueueinfo}) {
    filter.denyUnlessArgument(call, self, EPERM);
  }
  filter.deny(SYS_tkill, EPERM);
  filter.deny(SYS_pidfd_send_signal, EPERM);
}

}  // namespace

void installSystemCallFilter(int landlockVersion) {
  constexpr int kVersionWithTruncation = 3;
  constexpr int kVersionWithSignals = 6;
  Filter filter;
  filter.denyUnlessArgument(SYS_socket, {AF_INET, AF_INET6, AF_NETLINK}, EACCES);
  denyProcesses(filter);
  for (const long call : {SYS_io_uring_setup, SYS_ptrace, SYS_unshare, SYS_setns, SYS_keyctl, SYS_add_key}) {
    filter.deny(call, EPERM);
  }
  filter.deny(SYS_shmget, EACCES);
  filter.deny(SYS_shmat, EACCES);
  if (landlockVersion < kVersionWithTruncation) filter.deny(SYS_truncate, EACCES);
  if (landlockVersion < kVersionWithSignals) denySignalsToOthers(filter);
  filter.install();
}

}  // namespace qv::platform::launcher
