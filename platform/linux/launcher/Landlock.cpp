#include "platform/linux/launcher/Landlock.h"

#include <fcntl.h>
#include <linux/landlock.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <system_error>

namespace qv::platform::launcher {
namespace {

// Of the newest version that is used here; the installed header may be older. From the kernel's own documentation.
constexpr uint64_t kAccessRefer = 1ULL << 13;     // version 2
constexpr uint64_t kAccessTruncate = 1ULL << 14;  // version 3
constexpr uint64_t kAccessDevice = 1ULL << 15;    // version 5
constexpr uint64_t kScopeAbstractSocket = 1ULL << 0;
constexpr uint64_t kScopeSignal = 1ULL << 1;
struct RulesetAttributes {
  uint64_t handledFileSystem = 0;
  uint64_t handledNetwork = 0;  // version 4; nothing: the network stays open
  uint64_t scoped = 0;          // version 6
};
static_assert(sizeof(RulesetAttributes) == 24);

constexpr uint64_t kReadFile = LANDLOCK_ACCESS_FS_READ_FILE;
constexpr uint64_t kRead = kReadFile | LANDLOCK_ACCESS_FS_READ_DIR;
constexpr uint64_t kExecute = kRead | LANDLOCK_ACCESS_FS_EXECUTE;
constexpr uint64_t kUseDevice = kReadFile | LANDLOCK_ACCESS_FS_WRITE_FILE | kAccessDevice;
/// What nobody executes can be written: no program is made and run here.
constexpr uint64_t kWrite = kRead | LANDLOCK_ACCESS_FS_WRITE_FILE | kAccessTruncate | kAccessRefer |
                            LANDLOCK_ACCESS_FS_REMOVE_DIR | LANDLOCK_ACCESS_FS_REMOVE_FILE |
                            LANDLOCK_ACCESS_FS_MAKE_DIR | LANDLOCK_ACCESS_FS_MAKE_REG | LANDLOCK_ACCESS_FS_MAKE_SYM |
                            LANDLOCK_ACCESS_FS_MAKE_FIFO;
/// What can be said of a file that is no directory.
constexpr uint64_t kOfFiles =
    LANDLOCK_ACCESS_FS_EXECUTE | LANDLOCK_ACCESS_FS_WRITE_FILE | kReadFile | kAccessTruncate | kAccessDevice;

struct SystemPath {
  const char* path;
  uint64_t access;
};
/// Programs and libraries; what the C library, TLS libraries and name resolution read; harmless devices. Not the rest
/// of /etc, which has secrets.
constexpr SystemPath kSystemPaths[] = {
    {"/usr", kExecute},
    {"/bin", kExecute},
    {"/sbin", kExecute},
    {"/lib", kExecute},
    {"/lib32", kExecute},
    {"/lib64", kExecute},
    {"/opt", kExecute},
    {"/etc/ld.so.cache", kReadFile},
    {"/etc/ld.so.conf", kReadFile},
    {"/etc/ld.so.conf.d", kRead},
    {"/etc/alternatives", kRead},
    {"/etc/resolv.conf", kReadFile},
    {"/run/systemd/resolve", kRead},
    {"/run/NetworkManager/resolv.conf", kReadFile},
    {"/run/resolvconf", kRead},
    {"/etc/hosts", kReadFile},
    {"/etc/host.conf", kReadFile},
    {"/etc/gai.conf", kReadFile},
    {"/etc/nsswitch.conf", kReadFile},
    {"/etc/services", kReadFile},
    {"/etc/protocols", kReadFile},
    {"/etc/passwd", kReadFile},
    {"/etc/group", kReadFile},
    {"/etc/localtime", kReadFile},
    {"/etc/timezone", kReadFile},
    {"/etc/mime.types", kReadFile},
    {"/etc/ssl/certs", kRead},
    {"/etc/ssl/openssl.cnf", kReadFile},
    {"/etc/ca-certificates", kRead},
    {"/etc/pki", kRead},
    {"/etc/gnutls", kRead},
    {"/etc/crypto-policies", kRead},
    {"/etc/fonts", kRead},
    {"/dev/null", kUseDevice},
    {"/dev/zero", kUseDevice},
    {"/dev/full", kUseDevice},
    {"/dev/random", kUseDevice},
    {"/dev/urandom", kUseDevice},
    {"/proc/self", kRead},
    {"/proc/cpuinfo", kReadFile},
    {"/proc/meminfo", kReadFile},
    {"/proc/stat", kReadFile},
    {"/proc/version", kReadFile},
    {"/proc/sys/vm", kRead},
    {"/sys/devices/system/cpu", kRead},
};

[[noreturn]] void fail(const std::string& what) { throw std::system_error(errno, std::generic_category(), what); }

/// Every access that this version knows: what is not handled stays open.
uint64_t accessesOf(int version) {
  uint64_t handled = (LANDLOCK_ACCESS_FS_MAKE_SYM << 1) - 1;
  if (version >= 2) handled |= kAccessRefer;
  if (version >= 3) handled |= kAccessTruncate;
  if (version >= 5) handled |= kAccessDevice;
  return handled;
}

}  // namespace

int landlockVersion() {
  const long version = ::syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION);
  return version > 0 ? static_cast<int>(version) : 0;
}

Landlock::Landlock(const std::string& bundle, const std::string& container) {
  const int version = landlockVersion();
  handled_ = accessesOf(version);
  RulesetAttributes attributes;
  attributes.handledFileSystem = handled_;
  if (version >= 6) attributes.scoped = kScopeAbstractSocket | kScopeSignal;
  const size_t size = version >= 6 ? sizeof attributes : version >= 4 ? 16 : 8;
  ruleset_ = static_cast<int>(::syscall(SYS_landlock_create_ruleset, &attributes, size, 0));
  if (ruleset_ < 0) fail("landlock_create_ruleset");
  for (const SystemPath& each : kSystemPaths) allow(each.path, each.access, false);
  allow(bundle, kExecute, true);
  allow(container, kWrite, true);
}

Landlock::~Landlock() {
  if (ruleset_ >= 0) ::close(ruleset_);
}

void Landlock::allow(const std::string& path, uint64_t access, bool isRequired) {
  const int fd = ::open(path.c_str(), O_PATH | O_CLOEXEC);
  if (fd < 0 && !isRequired) return;
  if (fd < 0) fail(path);
  struct stat info {};
  if (::fstat(fd, &info) != 0) fail(path);
  if (!S_ISDIR(info.st_mode)) access &= kOfFiles;
  const landlock_path_beneath_attr rule{access & handled_, fd};
  const long r = ::syscall(SYS_landlock_add_rule, ruleset_, LANDLOCK_RULE_PATH_BENEATH, &rule, 0);
  const int failure = errno;
  ::close(fd);
  errno = failure;
  if (r != 0) fail("landlock_add_rule " + path);
}

void Landlock::enter() {
  if (::syscall(SYS_landlock_restrict_self, ruleset_, 0) != 0) fail("landlock_restrict_self");
}

}  // namespace qv::platform::launcher
