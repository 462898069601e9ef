#pragma once

#include <chrono>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"
#include "platform/base/Value.h"

/// Between the daemon and the service that starts extensions for it: a local socket of sequenced packets, each a
/// dictionary as JSON, with descriptors beside it. One connection serves one question, the first message:
///
///   {"start": identifier}, with the two endpoints   {"process": pid}, or {"error": ...} and the end; later
///                                                   {"willKill": error} and {"ended": status as of waitpid}
///   {"host": name}                                  {"flags": bits of platform/NetworkReachability.h}
///
/// After a start, whoever started ends the process by closing his side for writing, and is told its end; or by closing
/// it altogether. Errors have the form of encodeError.
namespace qv::platform::starter {

inline constexpr const char kStart[] = "start";
inline constexpr const char kProcess[] = "process";
inline constexpr const char kWillKill[] = "willKill";
inline constexpr const char kEnded[] = "ended";
inline constexpr const char kError[] = "error";
inline constexpr const char kHost[] = "host";
inline constexpr const char kFlags[] = "flags";

/// For the first message in either direction.
inline constexpr std::chrono::seconds kPatience{10};

struct Message {
  Dictionary content;
  std::vector<SharedFileDescriptor> descriptors;  ///< two at most
};

/// Never waits for a peer that does not read: the message is an error then.
std::optional<Error> send(const FileDescriptor& socket, const Message& message);
/// ECONNRESET where the other end is closed, ETIMEDOUT after the time given to `limitWaiting`, EBADMSG for what is no
/// message. Any input is safe.
Result<Message> receive(const FileDescriptor& socket);
/// Zero: without end.
void limitWaiting(const FileDescriptor& socket, std::chrono::seconds limit);

}  // namespace qv::platform::starter
