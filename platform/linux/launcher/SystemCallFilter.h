#pragma once

namespace qv::platform::launcher {

/// Closes what no rule on files reaches, for this process and all that it executes, for good:
///
/// - sockets of other families than IPv4, IPv6 and netlink. A local socket leads to the X server, the sound server
///   and the daemon itself, whatever the file rules say. The connections to the daemon are made from pairs.
/// - further processes: an extension is one, so that its pidfd ends all of it. Threads and exec are free.
/// - System V shared memory, namespaces, io_uring (which would get round this filter), tracing.
/// - signals to others, and truncation by path, where Landlock does not see to them.
///
/// Needs "no new privileges". Throws std::system_error.
void installSystemCallFilter(int landlockVersion);

}  // namespace qv::platform::launcher
