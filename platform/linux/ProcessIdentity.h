#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/Bundles.h"
#include "platform/IPC.h"

namespace qv::platform {

/// A process as its program of a bundle. The process is known by its pidfd and the time at which it began, the program
/// by device and inode of the file that the kernel runs: executing another one changes these.
///
/// Threading: thread-safe. It borrows the bundles.
class ProcessIdentity final : public PeerIdentity {
 public:
  /// Nothing for a process that has ended or becomes another program meanwhile, and for one whose executable is in no
  /// bundle, was deleted or replaced.
  [[nodiscard]] static std::shared_ptr<const ProcessIdentity> of(pid_t pid, SharedFileDescriptor handle,
                                                                 BundleService& bundles);
  [[nodiscard]] PeerStanding standing() const override;
  [[nodiscard]] const std::string& bundleIdentifier() const { return installed_.bundleIdentifier; }
  /// The executable's path.
  [[nodiscard]] const std::string& executable() const { return installed_.executable; }

 private:
  /// What a process runs.
  struct Program {
    uint64_t beginning = 0;  ///< of the process, in clock ticks since the boot
    dev_t device = 0;
    ino_t inode = 0;
    bool operator==(const Program&) const = default;
  };
  /// Where its executable is now.
  struct Installed {
    std::string executable;
    std::string bundleIdentifier;
  };
  ProcessIdentity(pid_t pid, SharedFileDescriptor handle, BundleService& bundles, Program program, Installed installed);
  static std::optional<Program> programOf(pid_t pid, const SharedFileDescriptor& handle);
  static std::optional<Installed> installedOf(pid_t pid, BundleService& bundles);

  const pid_t pid_;
  const SharedFileDescriptor handle_;
  BundleService& bundles_;
  const Program program_;
  const Installed installed_;
};

}  // namespace qv::platform
