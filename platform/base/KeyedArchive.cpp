#include "platform/base/KeyedArchive.h"

#include <cerrno>
#include <cstring>
#include <type_traits>

#include "platform/base/ValueTypes.h"

namespace qv::platform {
namespace {

constexpr std::string_view kMagic = "QVKA";
constexpr uint8_t kVersion = 1;
constexpr int kMaximumDepth = 16;

class Encoder {
 public:
  explicit Encoder(Data& out) : out_(out) {}

  template <typename T>
  void raw(T v) {
    const auto* bytes = reinterpret_cast<const uint8_t*>(&v);
    out_.insert(out_.end(), bytes, bytes + sizeof v);
  }
  void string(std::string_view text) {
    raw(static_cast<uint32_t>(text.size()));
    out_.insert(out_.end(), text.begin(), text.end());
  }
  void dictionary(const Dictionary& entries) {
    raw(static_cast<uint32_t>(entries.size()));
    for (const auto& [key, entry] : entries) {
      string(key);
      value(entry);
    }
  }
  void value(const Value& v) {
    raw(typeOf(v).archiveTag);
    v.visit([this](const auto& content) { write(content); });
  }

 private:
  void write(std::monostate) {}
  void write(const SharedFileDescriptor&) {}
  void write(bool v) { raw(static_cast<uint8_t>(v)); }
  template <typename Number>
  requires std::is_arithmetic_v<Number>
  void write(Number v) { raw(v); }
  void write(const std::string& v) { string(v); }
  void write(const Data& v) { string({reinterpret_cast<const char*>(v.data()), v.size()}); }
  void write(const Array& v) {
    raw(static_cast<uint32_t>(v.size()));
    for (const Value& element : v) value(element);
  }
  void write(const Dictionary& v) { dictionary(v); }
  void write(const Date& v) { raw(v.secondsSince1970); }
  void write(const URL& v) { string(v.absoluteString()); }

  Data& out_;
};

class Decoder {
 public:
  explicit Decoder(std::span<const uint8_t> bytes) : rest_(bytes) {}

  [[nodiscard]] bool failed() const { return failed_; }
  [[nodiscard]] bool atEnd() const { return rest_.empty(); }

  template <typename T>
  T raw() {
    T v{};
    if (rest_.size() < sizeof v) {
      failed_ = true;
      return v;
    }
    std::memcpy(&v, rest_.data(), sizeof v);
    rest_ = rest_.subspan(sizeof v);
    return v;
  }
  std::string_view bytes(size_t count) {
    if (rest_.size() < count) {
      failed_ = true;
      return {};
    }
    const std::string_view view(reinterpret_cast<const char*>(rest_.data()), count);
    rest_ = rest_.subspan(count);
    return view;
  }
  std::string_view string() { return bytes(raw<uint32_t>()); }
  /// A count of elements, each of which takes at least one byte.
  uint32_t count() {
    const auto n = raw<uint32_t>();
    if (n > rest_.size()) failed_ = true;
    return failed_ ? 0 : n;
  }

  Dictionary dictionary() {
    Dictionary entries;
    const uint32_t n = count();
    for (uint32_t i = 0; i < n && !failed_; ++i) {
      std::string key(string());
      entries.insert_or_assign(std::move(key), value());
    }
    return entries;
  }

 private:
  Value value() {
    Value v;
    if (depth_ > kMaximumDepth) failed_ = true;
    if (failed_) return v;
    const char tag = raw<char>();
    ++depth_;
    if (!readTagged(tag, v, [this]<typename Content>() { return read(std::type_identity<Content>()); })) failed_ = true;
    --depth_;
    return v;
  }

  SharedFileDescriptor read(std::type_identity<SharedFileDescriptor>) { return {}; }
  bool read(std::type_identity<bool>) { return raw<uint8_t>() != 0; }
  template <typename Number>
  requires std::is_arithmetic_v<Number> Number read(std::type_identity<Number>) { return raw<Number>(); }
  std::string read(std::type_identity<std::string>) { return std::string(string()); }
  Data read(std::type_identity<Data>) {
    const std::string_view content = string();
    return {content.begin(), content.end()};
  }
  Array read(std::type_identity<Array>) {
    Array elements;
    const uint32_t n = count();
    for (uint32_t i = 0; i < n && !failed_; ++i) elements.push_back(value());
    return elements;
  }
  Dictionary read(std::type_identity<Dictionary>) { return dictionary(); }
  Date read(std::type_identity<Date>) { return {raw<double>()}; }
  URL read(std::type_identity<URL>) { return URL(std::string(string())); }

  std::span<const uint8_t> rest_;
  bool failed_ = false;
  int depth_ = 0;  // of the value that is read
};

}  // namespace

Data encodeKeyedArchive(std::string_view className, const Dictionary& fields) {
  Data archive(kMagic.begin(), kMagic.end());
  Encoder encoder(archive);
  encoder.raw(kVersion);
  encoder.string(className);
  encoder.dictionary(fields);
  return archive;
}

Result<Dictionary> decodeKeyedArchive(std::span<const uint8_t> bytes, std::string_view expectedClass) {
  Decoder decoder(bytes);
  if (decoder.bytes(kMagic.size()) != kMagic || decoder.raw<uint8_t>() != kVersion) {
    return Error::posix(EBADMSG, "not a keyed archive");
  }
  const std::string_view className = decoder.string();
  if (decoder.failed() || className != expectedClass) return Error::posix(EBADMSG, "unexpected root class");
  Dictionary fields = decoder.dictionary();
  if (decoder.failed() || !decoder.atEnd()) return Error::posix(EBADMSG, "damaged keyed archive");
  return fields;
}

}  // namespace qv::platform
