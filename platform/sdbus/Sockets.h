#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <utility>

#include "platform/IPC.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform::sdbus {

/// The socket file of a service in a directory.
std::string socketPath(const std::string& directory, const std::string& serviceName);

/// A listening socket under a path. `lock` is held as long as this process serves the name.
struct NamedSocket {
  FileDescriptor socket;
  FileDescriptor lock;
};
/// Opens `path` for connections of root, this process's user, and the members of `group` (a name or a number; empty:
/// this process's own). A socket file that a dead process left is replaced; EADDRINUSE when a living one serves it.
Result<NamedSocket> listenAt(const std::string& path, const std::string& group);

/// The listening socket for `path` that the service manager opened for this process, if it did.
std::optional<FileDescriptor> adoptActivatedSocket(const std::string& path);

/// How long a listener's backlog may stay full for one who wants to connect.
inline constexpr std::chrono::seconds kConnectPatience{5};

/// Connects to a listening socket; EAGAIN after `kConnectPatience`.
Result<FileDescriptor> connectTo(const std::string& path);

/// A rendezvous: what holders of the second end send over it are ends of fresh stream pairs.
Result<std::pair<FileDescriptor, FileDescriptor>> createRendezvous();
/// Sends one end of a fresh pair to the listener and answers the other; ETIMEDOUT after `patience`.
Result<FileDescriptor> connectThrough(int rendezvous, std::chrono::milliseconds patience = kConnectPatience);
/// Takes the next connection; an invalid descriptor where what arrived was none, nothing when
/// nothing more is there.
std::optional<FileDescriptor> acceptFrom(int rendezvous);

/// The process on the other side of a socket, pinned.
IPCPeer peerOf(int socket);
/// Pins a peer's process where the kernel does not do it (before Linux 6.5): its pid may have been reused already, but
/// not while its socket is still open. Nothing where it is closed.
SharedFileDescriptor openPeerProcess(int socket, pid_t pid);
/// The user of it; -1 where the kernel does not tell.
uid_t userOf(int socket);
/// From now on the kernel tells of what is received which process sent it; so do the sockets that are accepted.
void askForSenders(int socket);

/// Lets this process have as many descriptors as it may ask for by itself, at most 65536: each
/// client takes five. To be called before there are clients: it may hold the process up for some milliseconds.
void raiseDescriptorLimit();

}  // namespace qv::platform::sdbus
