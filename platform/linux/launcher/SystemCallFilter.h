#pragma once

namespace qv::platform::launcher {

/// What else confines the process, so that the filter need not.
struct Confinement {
  int landlockVersion;
  bool hasOwnUser;  ///< the kernel's own checks keep it from what is others'
};

/// Lets through the system calls that programs need (SystemCallLists.h), for this process and all that it executes, for
/// good. Every other does not exist (ENOSYS), new ones of later kernels included. Of those that are let through it
/// refuses (EPERM):
///
/// - sockets of other families than IPv4, IPv6 and the kernel's routes, and pairs of local ones that could be sent
///   elsewhere. A local socket leads to the X server, the sound server and the daemon itself, whatever the file rules
///   say. The connections to the daemon are made from pairs.
/// - further processes: an extension is one, so that its pidfd ends all of it. Threads and exec are free.
/// - set-id bits for files, and what would undo this process's own confinement (prctl).
/// - limits, scheduling and signals of others, and the changing of a file's length, times or mode, where neither the
/// user
///   nor Landlock sees to them.
///
/// Needs "no new privileges". Throws std::system_error.
void installSystemCallFilter(const Confinement& confinement);

}  // namespace qv::platform::launcher
