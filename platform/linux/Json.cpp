#include "platform/linux/Json.h"

#include <cerrno>
#include <limits>
#include <nlohmann/json.hpp>
#include <stdexcept>
#include <utility>

#include "platform/linux/SmallFile.h"

namespace qv::platform {

using nlohmann::json;

namespace {

Error malformed(const std::string& what) {
  return {kPosixErrorDomain, EBADMSG, {{kLocalizedDescriptionKey, Value("malformed JSON: " + what)}}};
}

/// Asked at each event of the parser, so that nothing deep is built.
bool boundDepth(int depth, json::parse_event_t event, json& /*parsed*/) {
  const bool opens = event == json::parse_event_t::object_start || event == json::parse_event_t::array_start;
  if (opens && depth >= kMaximumJSONDepth) throw std::length_error("nested too deep");
  return true;
}

/// Texts go on to places where a zero byte would end them early.
const std::string& checked(const std::string& text) {
  if (text.find('\0') != std::string::npos) throw std::domain_error("zero character");
  return text;
}

Value fromUnsigned(uint64_t value) {
  const bool fits = value <= static_cast<uint64_t>(std::numeric_limits<int64_t>::max());
  return fits ? Value(static_cast<int64_t>(value)) : Value(value);
}

struct ToJSON {
  json operator()(std::monostate) const { return nullptr; }
  json operator()(const SharedFileDescriptor&) const { return nullptr; }
  json operator()(const Date& date) const { return date.secondsSince1970; }
  json operator()(const URL& url) const { return url.absoluteString(); }
  template <typename T>
  json operator()(const T& other) const {
    return other;
  }
};

}  // namespace

// The library finds these two by their names, for what stands in containers too.

static void to_json(json& out, const Value& value) { out = std::visit(ToJSON{}, value.storage()); }

static void from_json(const json& in, Value& value) {
  switch (in.type()) {
    case json::value_t::boolean:
      value = in.get<bool>();
      break;
    case json::value_t::number_integer:
      value = in.get<int64_t>();
      break;
    case json::value_t::number_unsigned:
      value = fromUnsigned(in.get<uint64_t>());
      break;
    case json::value_t::number_float:
      value = in.get<double>();
      break;
    case json::value_t::string:
      value = checked(in.get_ref<const std::string&>());
      break;
    case json::value_t::array:
      value = in.get<Array>();
      break;
    case json::value_t::object: {
      Dictionary dictionary;
      for (const auto& [key, entry] : in.items()) dictionary.emplace(checked(key), entry.get<Value>());
      value = std::move(dictionary);
      break;
    }
    default:
      value = Value();
      break;
  }
}

Result<Value> parseJSON(std::string_view text) {
  if (text.size() > kMaximumSmallFileSize) return malformed("too large");
  try {
    return json::parse(text, boundDepth).get<Value>();
  } catch (const json::exception& fault) {
    return malformed(fault.what());
  } catch (const std::logic_error& fault) {
    return malformed(fault.what());
  }
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
  return json(value).dump(-1, ' ', false, json::error_handler_t::replace);
}

}  // namespace qv::platform
