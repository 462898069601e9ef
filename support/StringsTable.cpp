#include "support/StringsTable.h"

#include <algorithm>
#include <cstdint>
#include <utility>

namespace qv {
namespace {

constexpr uint32_t kReplacement = 0xFFFD;

void appendUtf8(std::string& out, uint32_t c) {
  const auto put = [&](uint32_t byte) { out += static_cast<char>(byte); };
  if (c < 0x80) {
    put(c);
  } else if (c < 0x800) {
    put(0xC0 | c >> 6);
    put(0x80 | (c & 0x3F));
  } else if (c < 0x10000) {
    put(0xE0 | c >> 12);
    put(0x80 | (c >> 6 & 0x3F));
    put(0x80 | (c & 0x3F));
  } else {
    put(0xF0 | c >> 18);
    put(0x80 | (c >> 12 & 0x3F));
    put(0x80 | (c >> 6 & 0x3F));
    put(0x80 | (c & 0x3F));
  }
}

/// The length in bytes of the UTF-8 character at the front; 0 where there is none.
size_t utf8Length(std::string_view s) {
  const auto byte = [&](size_t i) { return static_cast<uint8_t>(s[i]); };
  const uint8_t first = byte(0);
  if (first < 0x80) return 1;
  const size_t length = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
  if (first < 0xC2 || first > 0xF4 || s.size() < length) return 0;
  for (size_t i = 1; i < length; ++i) {
    if ((byte(i) & 0xC0) != 0x80) return 0;
  }
  const bool overlong = (first == 0xE0 && byte(1) < 0xA0) || (first == 0xF0 && byte(1) < 0x90);
  const bool surrogate = first == 0xED && byte(1) >= 0xA0;
  const bool beyond = first == 0xF4 && byte(1) >= 0x90;
  return overlong || surrogate || beyond ? 0 : length;
}

class Parser {
 public:
  explicit Parser(std::string_view source) : rest_(source), source_(source) {}

  StringsTable parse() {
    if (source_.size() > kMaximumStringsTableSize) {
      fail("table too large");
    } else {
      if (rest_.starts_with("\xEF\xBB\xBF")) rest_.remove_prefix(3);
      while (parseEntry()) {
      }
    }
    return std::move(table_);
  }

 private:
  /// False at the end, and at a fault.
  bool parseEntry() {
    std::string key;
    std::string text;
    skipBlanks();
    if (rest_.empty() || !parseQuoted(key) || !expect('=')) return false;
    skipBlanks();
    if (!parseQuoted(text) || !expect(';')) return false;
    table_.texts.insert_or_assign(std::move(key), std::move(text));
    return true;
  }

  bool expect(char c) {
    skipBlanks();
    if (!rest_.starts_with(c)) return fail(std::string("'") + c + "' expected");
    rest_.remove_prefix(1);
    return true;
  }

  /// Skips white space and comments. One without end is a fault, and stays in front, where nothing else can be.
  void skipBlanks() {
    for (;;) {
      const size_t solid = rest_.find_first_not_of(" \t\r\n");
      rest_.remove_prefix(std::min(solid, rest_.size()));
      const bool line = rest_.starts_with("//");
      if (!line && !rest_.starts_with("/*")) return;
      const size_t end = line ? rest_.find('\n') : rest_.find("*/", 2);
      if (end == std::string_view::npos && !line) {
        fail("comment without end");
        return;
      }
      rest_.remove_prefix(end == std::string_view::npos ? rest_.size() : end + (line ? 1 : 2));
    }
  }

  bool parseQuoted(std::string& out) {
    if (!rest_.starts_with('"')) return fail("'\"' expected");
    rest_.remove_prefix(1);
    while (!rest_.empty()) {
      if (rest_.front() == '"') {
        rest_.remove_prefix(1);
        return true;
      }
      if (!(rest_.front() == '\\' ? parseEscape(out) : parseCharacter(out))) return false;
    }
    return fail("text without end");
  }

  bool parseCharacter(std::string& out) {
    const size_t length = utf8Length(rest_);
    if (length == 0 || rest_.front() == '\0') return fail("not UTF-8");
    out += rest_.substr(0, length);
    rest_.remove_prefix(length);
    return true;
  }

  bool parseEscape(std::string& out) {
    const char kind = rest_.size() > 1 ? rest_[1] : '\0';
    if (kind == 'U' || kind == 'u') {
      appendUtf8(out, parseUtf16());
      return !table_.fault;
    }
    rest_.remove_prefix(std::min<size_t>(2, rest_.size()));
    static constexpr std::string_view kKinds = "\"\\ntr";
    static constexpr std::string_view kMeanings = "\"\\\n\t\r";
    const size_t index = kKinds.find(kind);
    if (index == std::string_view::npos) return fail("unknown escape");
    out += kMeanings[index];
    return true;
  }

  /// One character of one escape, or of two that are a surrogate pair.
  uint32_t parseUtf16() {
    const uint32_t first = parseUnit();
    const bool high = first >= 0xD800 && first < 0xDC00;
    if (high && (rest_.starts_with("\\U") || rest_.starts_with("\\u"))) {
      const std::string_view before = rest_;
      const uint32_t second = parseUnit();
      if (second >= 0xDC00 && second < 0xE000) return 0x10000 + ((first - 0xD800) << 10) + (second - 0xDC00);
      rest_ = before;
    }
    return first == 0 || (first >= 0xD800 && first < 0xE000) ? kReplacement : first;
  }

  /// The value of an escape \Uxxxx at the front.
  uint32_t parseUnit() {
    uint32_t value = 0;
    for (size_t i = 2; i < 6; ++i) {
      static constexpr std::string_view kDigits = "0123456789abcdef0123456789ABCDEF";
      const size_t digit = i < rest_.size() ? kDigits.find(rest_[i]) : std::string_view::npos;
      if (digit == std::string_view::npos) {
        fail("four hexadecimal digits expected");
        return 0;
      }
      value = value * 16 + static_cast<uint32_t>(digit % 16);
    }
    rest_.remove_prefix(6);
    return value;
  }

  /// Keeps the first fault only.
  bool fail(const std::string& what) {
    if (!table_.fault) {
      const auto read = source_.substr(0, source_.size() - rest_.size());
      const auto line = std::count(read.begin(), read.end(), '\n') + 1;
      table_.fault = "line " + std::to_string(line) + ": " + what;
    }
    return false;
  }

  std::string_view rest_;
  const std::string_view source_;
  StringsTable table_;
};

}  // namespace

StringsTable parseStringsTable(std::string_view source) { return Parser(source).parse(); }

}  // namespace qv
