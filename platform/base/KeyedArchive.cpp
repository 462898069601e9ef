#include "platform/base/KeyedArchive.h"

#include <cerrno>
#include <cstring>
#include <optional>

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
  void tag(char c) { out_.push_back(static_cast<uint8_t>(c)); }
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
    std::visit([this](const auto& content) { write(content); }, v.storage());
  }

 private:
  void write(std::monostate) { tag('n'); }
  void write(const SharedFileDescriptor&) { tag('n'); }
  void write(bool v) { tag('b'), raw(static_cast<uint8_t>(v)); }
  void write(int32_t v) { tag('i'), raw(v); }
  void write(uint32_t v) { tag('u'), raw(v); }
  void write(int64_t v) { tag('x'), raw(v); }
  void write(uint64_t v) { tag('t'), raw(v); }
  void write(double v) { tag('d'), raw(v); }
  void write(const std::string& v) { tag('s'), string(v); }
  void write(const Data& v) {
    tag('y'), raw(static_cast<uint32_t>(v.size()));
    out_.insert(out_.end(), v.begin(), v.end());
  }
  void write(const Array& v) {
    tag('a'), raw(static_cast<uint32_t>(v.size()));
    for (const Value& element : v) value(element);
  }
  void write(const Dictionary& v) { tag('m'), dictionary(v); }
  void write(const Date& v) { tag('D'), raw(v.secondsSince1970); }
  void write(const URL& v) { tag('U'), string(v.absoluteString()); }

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

  Dictionary dictionary(int depth) {
    Dictionary entries;
    const uint32_t n = count();
    for (uint32_t i = 0; i < n && !failed_; ++i) {
      std::string key(string());
      entries.insert_or_assign(std::move(key), value(depth));
    }
    return entries;
  }

  Value value(int depth) {
    if (depth > kMaximumDepth) failed_ = true;
    if (failed_) return {};
    switch (static_cast<char>(raw<uint8_t>())) {
      case 'n':
        return {};
      case 'b':
        return Value(raw<uint8_t>() != 0);
      case 'i':
        return Value(raw<int32_t>());
      case 'u':
        return Value(raw<uint32_t>());
      case 'x':
        return Value(raw<int64_t>());
      case 't':
        return Value(raw<uint64_t>());
      case 'd':
        return Value(raw<double>());
      case 's':
        return Value(std::string(string()));
      case 'y': {
        const std::string_view content = string();
        return Value(Data(content.begin(), content.end()));
      }
      case 'a': {
        Array elements;
        const uint32_t n = count();
        for (uint32_t i = 0; i < n && !failed_; ++i) elements.push_back(value(depth + 1));
        return Value(std::move(elements));
      }
      case 'm':
        return Value(dictionary(depth + 1));
      case 'D':
        return Value(Date{raw<double>()});
      case 'U':
        return Value(URL(std::string(string())));
      default:
        failed_ = true;
        return {};
    }
  }

 private:
  std::span<const uint8_t> rest_;
  bool failed_ = false;
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
  Dictionary fields = decoder.dictionary(0);
  if (decoder.failed() || !decoder.atEnd()) return Error::posix(EBADMSG, "damaged keyed archive");
  return fields;
}

}  // namespace qv::platform
