#pragma once

namespace qv::platform::launcher {

/// Of the launcher as a guard: the extension's pidfd, and a socket whose other end only the daemon holds.
inline constexpr int kGuardedProcess = 3;
inline constexpr int kDaemonLife = 4;

/// Waits for the end of the extension, and kills it where the daemon ends first; then returns the status to leave with.
///
/// The parent-death signal alone does not do: a thread has none, and when one calls exec, it becomes the process.
/// The guard belongs to the daemon, which ends it, and to the daemon's user, so that no extension of another can.
int guardExtension();

}  // namespace qv::platform::launcher
