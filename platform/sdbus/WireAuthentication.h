#pragma once

#include <sys/types.h>

#include <memory>
#include <string>
#include <string_view>

namespace qv::platform::sdbus {

/// The authentication of a D-Bus connection, as its peer sends it: a dialogue of lines, and then messages.
///
/// No line of the peer's is handed on. For each one that is understood, sd-bus gets one of a few that stand here, so
/// that it parses nothing but those. It knows the socket that it reads from as this process's own: who the peer is, is
/// compared here.
///
/// Threading: one thread.
class WireAuthentication {
 public:
  enum class Step { GoesOn, Ends, Refused };

  virtual ~WireAuthentication() = default;
  /// Takes a line without its end, and appends to `passed` what sd-bus gets for it.
  [[nodiscard]] virtual Step take(std::string_view line, std::string& passed) = 0;
  /// How many bytes the dialogue has yet at the least, where `begun` is there of its next line.
  [[nodiscard]] virtual size_t least(std::string_view begun) const = 0;
  /// Whether both sides have agreed that messages may bring descriptors.
  [[nodiscard]] virtual bool agreedOnDescriptors() const = 0;
  /// Whether a byte of zero comes before the first line.
  [[nodiscard]] virtual bool beginsWithZero() const = 0;
};

/// Of a peer of user `peer` that connected to us, of user `own`. It has to be EXTERNAL.
[[nodiscard]] std::unique_ptr<WireAuthentication> authenticationOfClient(uid_t peer, uid_t own);
/// Of a peer that we connected to. sd-bus has sent all of our own lines at once.
[[nodiscard]] std::unique_ptr<WireAuthentication> authenticationOfServer();

}  // namespace qv::platform::sdbus
