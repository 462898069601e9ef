#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/sdbus/WireAuthentication.h"

namespace qv::platform::sdbus {

/// The largest message that passes: a broadcast's configuration of 1 MiB with as much beside it. Bytes, with the
/// header.
inline constexpr size_t kMaximumWireMessage = size_t{2} << 20;
/// The most descriptors that one message has: of a frame two.
inline constexpr size_t kMaximumWireDescriptors = 4;

/// What may go on to sd-bus: some lines of the authentication, or one message with all that belongs to it.
struct WireUnit {
  std::vector<uint8_t> bytes;
  std::vector<FileDescriptor> descriptors;
  bool isMessage = false;
};

/// What a peer sends, on its way to sd-bus: put together here, and passed on in whole messages with sound headers.
///
/// It tells how many bytes may be read next. None of those belongs to a later message, so the descriptors that come
/// with them belong to this one. What is wrong once stays wrong: nothing more is taken, and the descriptors are closed.
///
/// Threading: one thread; does no input or output.
class WireGate {
 public:
  explicit WireGate(std::unique_ptr<WireAuthentication> authentication) : authentication_(std::move(authentication)) {}

  /// Where the next bytes go. Not while a unit is finished and not taken.
  [[nodiscard]] std::span<uint8_t> room();
  /// So many bytes of `room` have come, and these descriptors with them.
  void filled(size_t size, std::vector<FileDescriptor> descriptors);

  [[nodiscard]] bool hasUnit() const { return isFinished_; }
  /// Only with `hasUnit`.
  [[nodiscard]] WireUnit takeUnit();
  /// Why nothing passes any more, in a few words; null where all is well.
  [[nodiscard]] const char* fault() const { return fault_; }

  [[nodiscard]] bool isAuthenticated() const { return !authentication_; }
  /// Bytes of what has begun, and of what is finished and not taken.
  [[nodiscard]] size_t heldBytes() const { return filled_; }

 private:
  void refuse(const char* fault);
  void takeDescriptors(std::vector<FileDescriptor> descriptors);
  void takeLines(std::span<const uint8_t> bytes);
  void takeByte(char byte);
  void takeLine();
  void takeMessage();

  /// Until it has ended.
  std::unique_ptr<WireAuthentication> authentication_;
  bool mayHaveDescriptors_ = false;
  size_t authenticationBytes_ = 0;  ///< so far
  std::string line_;
  std::string passed_;

  std::vector<uint8_t> bytes_;  ///< `filled_` of them count
  size_t filled_ = 0;
  size_t messageBytes_ = 0;  ///< 0 before its beginning is there
  std::vector<FileDescriptor> descriptors_;
  bool isFinished_ = false;
  const char* fault_ = nullptr;
};

}  // namespace qv::platform::sdbus
