#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"
#include "platform/sdbus/UserQuotas.h"
#include "platform/sdbus/WireGate.h"

namespace qv::platform::sdbus {

/// Who every byte of a connection has to come from: a socket can be left to another process.
struct WireSender {
  pid_t process = 0;
  uid_t user = 0;
};

/// What a connection knows of a peer that is not trusted.
struct PeerGuard {
  std::unique_ptr<QuotaShare> share;
  std::optional<WireSender> sender;  ///< nothing where the socket does not tell, of endpoints
};

/// The way in of a connection whose peer is not trusted. It reads the peer's socket, through a WireGate, and writes
/// what that passes into a socket pair, whose other end is all that sd-bus reads. Within the quota of the peer's user.
///
/// Threading: I/O thread.
class GatedInput {
 public:
  enum class Progress {
    Moved,   ///< sd-bus has something to read
    Idle,    ///< nothing to do before the peer sends, or sd-bus has read
    Paused,  ///< the user's calls of this moment are used up
    Refused  ///< for good; `refusal` says why
  };

  /// `socket` is borrowed. `side` tells who the peer is in the authentication.
  GatedInput(int socket, std::unique_ptr<WireAuthentication> authentication, PeerGuard guard);

  /// The end for sd-bus; once, first.
  [[nodiscard]] Result<FileDescriptor> open();
  /// Reads up to the end of one message at most, and hands on what there is room for. Messages wait until sd-bus has
  /// authenticated: it takes descriptors before that for an attack.
  [[nodiscard]] Progress advance(bool isBusReady);
  [[nodiscard]] const std::string& refusal() const { return refusal_; }
  [[nodiscard]] uid_t user() const { return guard_.share->quota().user(); }

  /// How long to wait after Paused. Then the next message is taken in any case: no connection of a busy user starves.
  [[nodiscard]] std::chrono::milliseconds beginPause();

  /// Something has begun that the peer has to end in time.
  [[nodiscard]] bool isUnfinished() const;
  /// Rises with all that the peer has ended.
  [[nodiscard]] uint64_t finishedUnits() const { return finishedUnits_; }

 private:
  struct Chunk;
  [[nodiscard]] Progress readUnit();
  [[nodiscard]] Progress take(Chunk& chunk, size_t size);
  [[nodiscard]] Progress handOn();
  [[nodiscard]] ssize_t write();
  [[nodiscard]] Progress refuse(const std::string& why);
  [[nodiscard]] bool mayBeginMessage();
  void finished();
  /// The peer is gone: sd-bus reads what there is, and then the end.
  [[nodiscard]] Progress end();

  const int socket_;
  const PeerGuard guard_;
  WireGate gate_;
  FileDescriptor output_;  ///< what is written here, sd-bus reads
  std::optional<WireUnit> leaving_;
  size_t written_ = 0;  ///< of it
  bool hasEnded_ = false;
  bool isForgiven_ = false;
  uint64_t finishedUnits_ = 0;
  std::string refusal_;
};

}  // namespace qv::platform::sdbus
