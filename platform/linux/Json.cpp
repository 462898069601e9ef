#include "platform/linux/Json.h"

#include <cerrno>
#include <limits>
#include <nlohmann/json.hpp>
#include <utility>
#include <vector>

#include "platform/linux/SmallFile.h"

namespace qv::platform {
namespace {

using nlohmann::json;

Error malformed(const std::string& what) {
  return {kPosixErrorDomain, EBADMSG, {{kLocalizedDescriptionKey, Value("malformed JSON: " + what)}}};
}

/// Builds a Value from the parser's events. The open containers stand in a list of their own, so that
/// no input makes anything recurse.
class Builder final : public nlohmann::json_sax<json> {
 public:
  Value takeResult() { return std::move(result_); }
  const std::string& fault() const { return fault_; }

  bool null() override { return add(Value()); }
  bool boolean(bool value) override { return add(Value(value)); }
  bool number_integer(number_integer_t value) override { return add(Value(int64_t{value})); }
  bool number_unsigned(number_unsigned_t value) override {
    const bool fits = value <= static_cast<uint64_t>(std::numeric_limits<int64_t>::max());
    return add(fits ? Value(static_cast<int64_t>(value)) : Value(uint64_t{value}));
  }
  bool number_float(number_float_t value, const string_t&) override { return add(Value(value)); }
  bool string(string_t& value) override {
    if (!isText(value)) return false;
    return add(Value(std::move(value)));
  }
  bool binary(binary_t&) override { return fail("binary data"); }
  bool start_object(std::size_t) override { return open(false); }
  bool start_array(std::size_t) override { return open(true); }
  bool end_object() override { return close(); }
  bool end_array() override { return close(); }
  bool key(string_t& value) override {
    if (!isText(value)) return false;
    open_.back().key = std::move(value);
    return true;
  }
  bool parse_error(std::size_t position, const std::string&, const nlohmann::detail::exception&) override {
    return fail("at byte " + std::to_string(position));
  }

 private:
  struct Container {
    bool isArray;
    Array array;
    Dictionary dictionary;
    std::string key;
  };

  /// Texts go on to places where a zero byte would end them early.
  bool isText(const std::string& value) { return value.find('\0') == std::string::npos || fail("zero character"); }

  bool open(bool isArray) {
    if (open_.size() >= kMaximumJSONDepth) return fail("nested too deep");
    open_.push_back({isArray, {}, {}, {}});
    return true;
  }
  bool close() {
    Container done = std::move(open_.back());
    open_.pop_back();
    return add(done.isArray ? Value(std::move(done.array)) : Value(std::move(done.dictionary)));
  }
  bool add(Value value) {
    if (open_.empty()) {
      result_ = std::move(value);
    } else if (open_.back().isArray) {
      open_.back().array.push_back(std::move(value));
    } else {
      open_.back().dictionary.insert_or_assign(std::move(open_.back().key), std::move(value));
    }
    return true;
  }
  bool fail(const std::string& what) {
    if (fault_.empty()) fault_ = what;
    return false;
  }

  std::vector<Container> open_;
  Value result_;
  std::string fault_;
};

json toJSON(const Value& value);

struct ToJSON {
  json operator()(std::monostate) const { return nullptr; }
  json operator()(const SharedFileDescriptor&) const { return nullptr; }
  json operator()(const Date& date) const { return date.secondsSince1970; }
  json operator()(const URL& url) const { return url.absoluteString(); }
  json operator()(const Array& array) const {
    json out = json::array();
    for (const Value& element : array) out.push_back(toJSON(element));
    return out;
  }
  json operator()(const Dictionary& dictionary) const {
    json out = json::object();
    for (const auto& [key, entry] : dictionary) out[key] = toJSON(entry);
    return out;
  }
  template <typename T>
  json operator()(const T& plain) const {
    return plain;
  }
};

json toJSON(const Value& value) { return std::visit(ToJSON{}, value.storage()); }

}  // namespace

Result<Value> parseJSON(std::string_view text) {
  if (text.size() > kMaximumSmallFileSize) return malformed("too large");
  Builder builder;
  if (!json::sax_parse(text, &builder)) return malformed(builder.fault());
  return builder.takeResult();
}

Result<Dictionary> readJSONDictionary(const std::string& path) {
  const auto content = readSmallFile(path);
  if (!content) return content.error();
  const auto value = parseJSON(content.value());
  if (!value) return value.error();
  if (value.value().getIf<Dictionary>() == nullptr) return malformed("not a dictionary");
  return value.value().asDictionary();
}

std::string serializeJSON(const Value& value) {
  return toJSON(value).dump(-1, ' ', false, json::error_handler_t::replace);
}

}  // namespace qv::platform
