#include "platform/linux/ProcessIdentity.h"

#include <poll.h>
#include <sys/stat.h>

#include <sstream>
#include <utility>

#include "platform/linux/SmallFile.h"

namespace qv::platform {
namespace {

/// Whether the pinned process still runs: a pidfd becomes readable when it ends.
bool isRunning(const SharedFileDescriptor& process) {
  if (!process) return false;
  pollfd state{process->get(), POLLIN, 0};
  return ::poll(&state, 1, 0) == 0;
}

/// The 22nd field of a process's "stat". The second is its name, in brackets, and may hold anything.
std::optional<uint64_t> beginningOf(const std::string& stat) {
  constexpr int kFieldsBetween = 19;
  const size_t name = stat.rfind(')');
  if (name == std::string::npos) return std::nullopt;
  std::istringstream fields(stat.substr(name + 1));
  std::string skipped;
  for (int i = 0; i < kFieldsBetween; ++i) fields >> skipped;
  uint64_t ticks = 0;
  return fields >> ticks ? std::optional(ticks) : std::nullopt;
}

}  // namespace

ProcessIdentity::ProcessIdentity(pid_t pid, SharedFileDescriptor handle, BundleService& bundles, Program program,
                                 Installed installed)
    : pid_(pid), handle_(std::move(handle)), bundles_(bundles), program_(program), installed_(std::move(installed)) {}

/// What is read in several steps counts only where the process ran the same before and after them.
std::shared_ptr<const ProcessIdentity> ProcessIdentity::of(pid_t pid, SharedFileDescriptor handle,
                                                           BundleService& bundles) {
  const auto before = programOf(pid, handle);
  auto installed = before ? installedOf(pid, bundles) : std::nullopt;
  if (!installed || programOf(pid, handle) != before) return nullptr;
  return std::shared_ptr<const ProcessIdentity>(
      new ProcessIdentity(pid, std::move(handle), bundles, *before, std::move(*installed)));
}

PeerStanding ProcessIdentity::standing() const {
  if (programOf(pid_, handle_) != program_) return PeerStanding::AnotherProgram;
  const auto now = installedOf(pid_, bundles_);
  if (programOf(pid_, handle_) != program_) return PeerStanding::AnotherProgram;
  const bool isSame = now && now->bundleIdentifier == installed_.bundleIdentifier;
  return isSame ? PeerStanding::Same : PeerStanding::Uninstalled;
}

std::optional<ProcessIdentity::Program> ProcessIdentity::programOf(pid_t pid, const SharedFileDescriptor& handle) {
  if (pid <= 0) return std::nullopt;
  const std::string directory = "/proc/" + std::to_string(pid);
  const auto stat = readSmallFile(directory + "/stat");
  const auto beginning = stat ? beginningOf(stat.value()) : std::nullopt;
  struct stat running {};
  if (!beginning || ::stat((directory + "/exe").c_str(), &running) != 0) return std::nullopt;
  // The process was pinned before: while it still runs, the pid was its own all along.
  if (!isRunning(handle)) return std::nullopt;
  return Program{*beginning, running.st_dev, running.st_ino};
}

std::optional<ProcessIdentity::Installed> ProcessIdentity::installedOf(pid_t pid, BundleService& bundles) {
  auto executable = bundles.executablePathOfProcess(pid);
  const BundleRef bundle = executable ? bundles.bundleEnclosingExecutable(*executable) : nullptr;
  if (!bundle || bundle->bundleIdentifier().empty()) return std::nullopt;
  return Installed{std::move(*executable), bundle->bundleIdentifier()};
}

}  // namespace qv::platform
