#include "platform/sdbus/WireHeader.h"

#include <systemd/sd-bus.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <optional>
#include <string_view>

namespace qv::platform::sdbus {
namespace {

constexpr size_t kFieldAlignment = 8;
constexpr uint8_t kProtocolVersion = 1;
constexpr std::string_view kLocalPath = "/org/freedesktop/DBus/Local";
constexpr std::string_view kLocalName = "org.freedesktop.DBus.Local";

/// By the numbers that stand in messages.
enum Field : uint8_t { Path = 1, Interface, Member, ErrorName, ReplySerial, Destination, Sender, Signature, UnixFDs };
constexpr size_t kFields = UnixFDs + 1;

bool isOrder(uint8_t mark) { return mark == 'l' || mark == 'B'; }

uint64_t aligned(uint64_t size) { return (size + kFieldAlignment - 1) & ~uint64_t{kFieldAlignment - 1}; }

/// Reads one value after the other; once one was not there, none is.
///
/// Threading: one thread.
class WireReader {
 public:
  /// `message` begins with the mark of its byte order.
  explicit WireReader(std::span<const uint8_t> message)
      : message_(message), isSwapped_((message[0] == 'l') != (std::endian::native == std::endian::little)) {}

  void moveTo(size_t position) { position_ = position; }
  [[nodiscard]] size_t position() const { return position_; }

  /// Skips zeros only.
  bool align(size_t alignment) {
    while (position_ % alignment != 0) {
      if (position_ >= message_.size() || message_[position_++] != 0) return false;
    }
    return true;
  }
  std::optional<uint8_t> byte() {
    if (position_ >= message_.size()) return std::nullopt;
    return message_[position_++];
  }
  std::optional<uint32_t> number() {
    uint32_t value = 0;
    if (!align(sizeof value) || message_.size() - position_ < sizeof value) return std::nullopt;
    std::memcpy(&value, &message_[position_], sizeof value);
    position_ += sizeof value;
    return isSwapped_ ? __builtin_bswap32(value) : value;
  }
  /// A text of that many bytes, without zeros but with one after its end.
  std::optional<std::string_view> text(std::optional<uint32_t> size) {
    if (!size || *size >= message_.size() - position_) return std::nullopt;
    const std::string_view found(reinterpret_cast<const char*>(&message_[position_]), *size);
    if (message_[position_ + *size] != 0 || found.find('\0') != std::string_view::npos) return std::nullopt;
    position_ += *size + 1;
    return found;
  }

 private:
  const std::span<const uint8_t> message_;
  const bool isSwapped_;
  size_t position_ = 0;
};

/// The fields of one header.
///
/// Threading: one thread.
class WireFields {
 public:
  /// Up to `end`; what is wrong, or null.
  const char* read(WireReader& reader, size_t end) {
    while (reader.position() < end) {
      if (!reader.align(kFieldAlignment)) return "padding in the header";
      const auto code = reader.byte();
      if (!code || *code == 0 || *code >= kFields) return "an unknown header field";
      if (has_[*code]) return "a header field twice";
      has_[*code] = true;
      if (!readValue(reader, static_cast<Field>(*code))) return "a malformed header field";
    }
    return reader.position() == end ? nullptr : "a header field beyond its end";
  }

  [[nodiscard]] bool has(Field field) const { return has_[field]; }
  [[nodiscard]] bool claimsToBeLocal() const { return claimsToBeLocal_; }
  [[nodiscard]] size_t descriptors() const { return descriptors_; }
  [[nodiscard]] bool hasContents() const { return hasContents_; }

 private:
  bool readValue(WireReader& reader, Field field) {
    const auto type = reader.text(reader.byte());
    if (field == ReplySerial || field == UnixFDs) {
      const auto number = type == "u" ? reader.number() : std::nullopt;
      if (number && field == UnixFDs) descriptors_ = *number;
      return number && (field == UnixFDs || *number != 0);
    }
    if (field == Signature) return type == "g" && readSignature(reader);
    if (type != (field == Path ? "o" : "s")) return false;
    const auto text = reader.text(reader.number());
    if (!text) return false;
    claimsToBeLocal_ |= *text == (field == Path ? kLocalPath : kLocalName);
    return isName(field, text->data());
  }

  bool readSignature(WireReader& reader) {
    const auto signature = reader.text(reader.byte());
    if (!signature) return false;
    hasContents_ = !signature->empty();
    return isWireSignature({reinterpret_cast<const uint8_t*>(signature->data()), signature->size()});
  }

  static bool isName(Field field, const char* text) {
    switch (field) {
      case Path:
        return sd_bus_object_path_is_valid(text) > 0;
      case Member:
        return sd_bus_member_name_is_valid(text) > 0;
      case Interface:
      case ErrorName:
        return sd_bus_interface_name_is_valid(text) > 0;
      default:
        return sd_bus_service_name_is_valid(text) > 0;
    }
  }

  std::array<bool, kFields> has_{};
  bool claimsToBeLocal_ = false;
  bool hasContents_ = false;
  size_t descriptors_ = 0;
};

bool hasWhatItsTypeNeeds(uint8_t type, const WireFields& fields) {
  switch (type) {
    case SD_BUS_MESSAGE_METHOD_CALL:
      return fields.has(Path) && fields.has(Member) && !fields.has(ReplySerial);
    case SD_BUS_MESSAGE_SIGNAL:
      return fields.has(Path) && fields.has(Interface) && fields.has(Member) && !fields.has(ReplySerial);
    case SD_BUS_MESSAGE_METHOD_RETURN:
      return fields.has(ReplySerial);
    case SD_BUS_MESSAGE_METHOD_ERROR:
      return fields.has(ReplySerial) && fields.has(ErrorName);
    default:
      return false;
  }
}

}  // namespace

uint64_t sizeOfWireMessage(std::span<const uint8_t> beginning) {
  if (beginning.size() < kWireHeaderBytes || !isOrder(beginning[0]) || beginning[3] != kProtocolVersion) return 0;
  WireReader reader(beginning);
  reader.moveTo(4);
  const uint64_t body = reader.number().value_or(0);
  const uint32_t serial = reader.number().value_or(0);
  const uint64_t fields = reader.number().value_or(0);
  return serial == 0 ? 0 : kWireHeaderBytes + aligned(fields) + body;
}

const char* faultOfWireMessage(std::span<const uint8_t> message, size_t descriptors) {
  if (sizeOfWireMessage(message) != message.size()) return "a malformed header";
  WireReader reader(message);
  reader.moveTo(4);
  const size_t body = reader.number().value_or(0);
  reader.moveTo(kWireHeaderBytes - sizeof(uint32_t));
  const size_t end = kWireHeaderBytes + reader.number().value_or(0);
  // A field that claims to go on in the body is one that does not end where the fields do.
  WireReader fieldReader(message.first(std::min(end, message.size())));
  fieldReader.moveTo(kWireHeaderBytes);
  WireFields fields;
  if (const char* fault = fields.read(fieldReader, end)) return fault;
  reader.moveTo(end);
  if (!reader.align(kFieldAlignment)) return "padding after the header";
  if (!hasWhatItsTypeNeeds(message[1], fields)) return "a header without what its type needs";
  if (fields.claimsToBeLocal()) return "a header that claims to be local";
  if (body > 0 && !fields.hasContents()) return "a body without a signature";
  return fields.descriptors() == descriptors ? nullptr : "another number of descriptors than the header tells";
}

}  // namespace qv::platform::sdbus
