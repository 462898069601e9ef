#include "tests/security/ExtensionAttacks.h"

#include <fcntl.h>
#include <pthread.h>
#include <sched.h>
#include <signal.h>
#include <sys/ipc.h>
#include <sys/mman.h>
#include <sys/msg.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/sem.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <functional>
#include <map>
#include <thread>
#include <vector>

namespace qv {
namespace {

/// `result` is a call's, negative where it failed.
std::string outcome(long result) { return result >= 0 ? "ok" : "errno " + std::to_string(errno); }

std::string home(const std::string& name) { return std::string(std::getenv("HOME")) + "/" + name; }

std::string modeThroughDescriptor(const std::string& path) {
  const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  return outcome(file < 0 ? file : ::fchmod(file, 0666));
}

std::string setIdFile(const std::string&) {
  const int made = ::open(home("made").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 04755);
  if (made >= 0) return "ok";
  const int plain = ::open(home("plain").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0755);
  return outcome(::fchmod(plain, 04755));
}

std::string limitOf(const std::string& process) {
  const rlimit none{0, 0};
  return outcome(::prlimit(std::atoi(process.c_str()), RLIMIT_FSIZE, &none, nullptr));
}

std::string affinityOf(const std::string& process) {
  cpu_set_t one;
  CPU_ZERO(&one);
  CPU_SET(0, &one);
  return outcome(::sched_setaffinity(std::atoi(process.c_str()), sizeof one, &one));
}

std::string memoryOf(const std::string& process) {
  char byte = 0;
  const iovec here{&byte, 1}, there{const_cast<char*>("x"), 1};
  return outcome(::process_vm_readv(std::atoi(process.c_str()), &here, 1, &there, 1, 0));
}

/// A pipe that signals somebody else when something comes.
std::string signalByPipe(const std::string& process) {
  std::array<int, 2> ends{};
  return outcome(::pipe2(ends.data(), O_CLOEXEC) != 0 ? -1 : ::fcntl(ends[0], F_SETOWN, std::atoi(process.c_str())));
}

std::string datagramPair(const std::string&) {
  std::array<int, 2> ends{};
  return outcome(::socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0, ends.data()));
}

/// As many MiB, in files that have their name or none.
std::string fill(int megabytes, int flags, const std::string& name) {
  constexpr int kMegabytesOfFile = 128;
  for (int i = 0; i < megabytes / kMegabytesOfFile; ++i) {
    const std::string path = flags == O_TMPFILE ? home("") : home(name + std::to_string(i));
    const int file = ::open(path.c_str(), O_WRONLY | flags, 0600);
    if (file < 0 || ::fallocate(file, 0, 0, off_t{kMegabytesOfFile} << 20) != 0) return outcome(-1);
  }
  return "ok";
}

std::string tooLargeFile(const std::string&) {
  const int file = ::open(home("large").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  return outcome(::ftruncate(file, off_t{1} << 40));
}

/// How many there were when there could be no more.
std::string threads(const std::string&) {
  constexpr int kEndless = 100'000;
  constexpr size_t kSmallStack = 64 * 1024;
  pthread_attr_t small;
  pthread_attr_init(&small);
  pthread_attr_setstacksize(&small, kSmallStack);
  int made = 0;
  pthread_t thread;
  const auto wait = [](void*) -> void* {
    while (true) ::pause();
  };
  while (made < kEndless && ::pthread_create(&thread, &small, wait, nullptr) == 0) ++made;
  return std::to_string(made);
}

/// How many MiB there were when there could be no more.
std::string memory(const std::string&) {
  constexpr size_t kStep = size_t{64} << 20;
  constexpr int kEndless = 64 * 1024;
  int megabytes = 0;
  while (megabytes < kEndless && ::mmap(nullptr, kStep, PROT_READ | PROT_WRITE,
                                        MAP_SHARED | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0) != MAP_FAILED) {
    megabytes += kStep >> 20;
  }
  return std::to_string(megabytes);
}

std::string floodErrors(const std::string& megabytes) {
  const std::string line(1023, 'x');
  for (int i = 0; i < std::atoi(megabytes.c_str()) * 1024; ++i) {
    const std::string text = std::to_string(i) + line.substr(std::to_string(i).size()) + "\n";
    if (::write(STDERR_FILENO, text.data(), text.size()) < 0) return outcome(-1);
  }
  return "ok";
}

/// Becomes a shell, which gets `argument`. A thread that does so has no parent-death signal.
void become(const std::string& argument) {
  ::execl("/bin/sh", "sh", "-c", argument.c_str(), nullptr);
  ::_exit(errno);
}
std::string becomeInThread(const std::string& argument) {
  std::thread([argument] { become(argument); }).detach();
  return "ok";
}

using Attack = std::function<std::string(const std::string&)>;
const std::map<std::string, Attack>& attacks() {
  static const std::map<std::string, Attack> all = {
      {"mode", [](const auto& path) { return outcome(::chmod(path.c_str(), 04755)); }},
      {"plain mode", [](const auto& path) { return outcome(::chmod(path.c_str(), 0666)); }},
      {"mode through descriptor", modeThroughDescriptor},
      {"set-id file", setIdFile},
      {"owner", [](const auto& path) { return outcome(::chown(path.c_str(), ::getuid(), ::getgid())); }},
      {"times", [](const auto& path) { return outcome(::utimensat(AT_FDCWD, path.c_str(), nullptr, 0)); }},
      {"attribute", [](const auto& path) { return outcome(::setxattr(path.c_str(), "user.x", "x", 1, 0)); }},
      {"make", [](const auto& path) { return outcome(::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600)); }},
      {"limit", limitOf},
      {"affinity", affinityOf},
      {"priority", [](const auto& pid) { return outcome(::setpriority(PRIO_PROCESS, std::stoi(pid), 19)); }},
      {"all priorities", [](const auto& user) { return outcome(::setpriority(PRIO_USER, std::stoi(user), 19)); }},
      {"signal by pipe", signalByPipe},
      {"trace", [](const auto& pid) { return outcome(::ptrace(PTRACE_ATTACH, std::stoi(pid), 0, 0)); }},
      {"memory of", memoryOf},
      {"clear death signal", [](const auto&) { return outcome(::prctl(PR_SET_PDEATHSIG, 0)); }},
      {"hide from trace", [](const auto&) { return outcome(::prctl(PR_SET_DUMPABLE, 0)); }},
      {"message queue", [](const auto&) { return outcome(::msgget(IPC_PRIVATE, IPC_CREAT | 0600)); }},
      {"semaphores", [](const auto&) { return outcome(::semget(IPC_PRIVATE, 1, IPC_CREAT | 0600)); }},
      {"shared memory", [](const auto&) { return outcome(::shmget(IPC_PRIVATE, 4096, IPC_CREAT | 0600)); }},
      {"posix queue",
       [](const auto&) { return outcome(::syscall(SYS_mq_open, "x", O_CREAT | O_RDWR, 0600, nullptr)); }},
      {"memory file", [](const auto&) { return outcome(::memfd_create("x", MFD_CLOEXEC)); }},
      {"user namespace", [](const auto&) { return outcome(::unshare(CLONE_NEWUSER)); }},
      {"io_uring", [](const auto&) { return outcome(::syscall(SYS_io_uring_setup, 1, nullptr)); }},
      {"datagram pair", datagramPair},
      {"packet route", [](const auto&) { return outcome(::socket(AF_NETLINK, SOCK_RAW, 9 /* NETLINK_AUDIT */)); }},
      {"too large file", tooLargeFile},
      {"fill", [](const auto& megabytes) { return fill(std::stoi(megabytes), O_CREAT, "filler"); }},
      {"fill unnamed", [](const auto& megabytes) { return fill(std::stoi(megabytes), O_TMPFILE, ""); }},
      {"threads", threads},
      {"memory", memory},
      {"flood errors", floodErrors},
      {"process", [](const auto&) { return std::to_string(::getpid()); }},
      {"become in thread", becomeInThread},
  };
  return all;
}

}  // namespace

std::string attack(const std::string& name, const std::string& argument) {
  if (name == "become") become(argument);
  const auto known = attacks().find(name);
  return known == attacks().end() ? "unknown command" : known->second(argument);
}

}  // namespace qv
