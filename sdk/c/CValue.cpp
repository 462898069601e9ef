#include "sdk/c/CValue.h"

#include <iterator>
#include <type_traits>
#include <utility>

using Content = quorvel_value::Content;
using List = quorvel_value::List;
using Dictionary = quorvel_value::Dictionary;

static_assert(std::is_same_v<std::variant_alternative_t<QUORVEL_VALUE_INTEGER, Content>, int64_t>);
static_assert(std::is_same_v<std::variant_alternative_t<QUORVEL_VALUE_DICTIONARY, Content>, Dictionary>);

namespace {

template <typename T>
const T* contentOf(const quorvel_value* value) {
  return value ? std::get_if<T>(&value->content) : nullptr;
}

template <typename T>
quorvel_value* create(T content) {
  return new quorvel_value(std::move(content));
}

/// Whether `searched` is `value`, or somewhere in it.
bool holds(const quorvel_value* value, const quorvel_value* searched) {
  if (value == searched) return true;
  for (size_t i = 0; i < quorvel_value_get_count(value); ++i)
    if (holds(quorvel_value_get_entry(value, i), searched)) return true;
  return false;
}

/// What has a value inside that holds the whole would never end.
bool mayTake(const quorvel_value* container, const quorvel_value* value) {
  return container && value && !holds(value, container);
}

quorvel::Value plain(const quorvel_value& value) {
  return std::visit(
      [](const auto& content) -> quorvel::Value {
        using T = std::decay_t<decltype(content)>;
        if constexpr (std::is_same_v<T, List>) {
          quorvel::Value::Array array;
          for (const auto& entry : content) array.push_back(plain(*entry));
          return {std::move(array)};
        } else if constexpr (std::is_same_v<T, Dictionary>) {
          quorvel::Dictionary dictionary;
          for (const auto& [key, entry] : content) dictionary[key] = plain(*entry);
          return {std::move(dictionary)};
        } else {
          return {content};
        }
      },
      value.content);
}

}  // namespace

namespace qv::c {

quorvel_value::Reference valueFor(const quorvel::Dictionary& dictionary) {
  Dictionary entries;
  for (const auto& [key, entry] : dictionary) entries[key] = valueFor(entry);
  return quorvel_value::Reference(create(std::move(entries)));
}

quorvel_value::Reference valueFor(const quorvel::Value& value) {
  return std::visit(
      [](const auto& content) -> quorvel_value::Reference {
        using T = std::decay_t<decltype(content)>;
        if constexpr (std::is_same_v<T, quorvel::Dictionary>) {
          return valueFor(content);
        } else if constexpr (std::is_same_v<T, quorvel::Value::Array>) {
          List entries;
          for (const auto& entry : content) entries.push_back(valueFor(entry));
          return quorvel_value::Reference(create(std::move(entries)));
        } else {
          return quorvel_value::Reference(create(content));
        }
      },
      value.content);
}

quorvel::Dictionary dictionaryOf(const quorvel_value* value) {
  if (!contentOf<Dictionary>(value)) return {};
  return std::get<quorvel::Dictionary>(plain(*value).content);
}

}  // namespace qv::c

quorvel_value* quorvel_value_create_bool(bool value) { return create(value); }
quorvel_value* quorvel_value_create_integer(int64_t value) { return create(value); }
quorvel_value* quorvel_value_create_real(double value) { return create(value); }
quorvel_value* quorvel_value_create_text(const char* text) { return create(std::string(text ? text : "")); }
quorvel_value* quorvel_value_create_list(void) { return create(List()); }
quorvel_value* quorvel_value_create_dictionary(void) { return create(Dictionary()); }
quorvel_value* quorvel_value_create_bytes(const void* bytes, size_t size) {
  const auto* first = static_cast<const uint8_t*>(bytes);
  return create(first ? std::vector<uint8_t>(first, first + size) : std::vector<uint8_t>());
}

const quorvel_value* quorvel_value_retain(const quorvel_value* value) { return qv::c::retain<quorvel_value>(value); }
void quorvel_value_release(const quorvel_value* value) { qv::c::release<quorvel_value>(value); }

bool quorvel_list_append(quorvel_value* list, quorvel_value* value) {
  quorvel_value::Reference taken(value);
  auto* entries = list ? std::get_if<List>(&list->content) : nullptr;
  if (!entries || !mayTake(list, value)) return false;
  entries->push_back(std::move(taken));
  return true;
}

bool quorvel_dictionary_set(quorvel_value* dictionary, const char* key, quorvel_value* value) {
  quorvel_value::Reference taken(value);
  auto* entries = dictionary ? std::get_if<Dictionary>(&dictionary->content) : nullptr;
  if (!entries || !mayTake(dictionary, value)) return false;
  (*entries)[key ? key : ""] = std::move(taken);
  return true;
}

quorvel_value_type quorvel_value_get_type(const quorvel_value* value) {
  return value ? static_cast<quorvel_value_type>(value->content.index()) : QUORVEL_VALUE_NONE;
}

bool quorvel_value_get_bool(const quorvel_value* value) {
  const auto* content = contentOf<bool>(value);
  return content && *content;
}

int64_t quorvel_value_get_integer(const quorvel_value* value) {
  const auto* content = contentOf<int64_t>(value);
  return content ? *content : 0;
}

double quorvel_value_get_real(const quorvel_value* value) {
  const auto* content = contentOf<double>(value);
  return content ? *content : static_cast<double>(quorvel_value_get_integer(value));
}

const char* quorvel_value_get_text(const quorvel_value* value) {
  const auto* content = contentOf<std::string>(value);
  return content ? content->c_str() : nullptr;
}

const void* quorvel_value_get_bytes(const quorvel_value* value, size_t* size) {
  const auto* content = contentOf<std::vector<uint8_t>>(value);
  *size = content ? content->size() : 0;
  return content ? content->data() : nullptr;
}

size_t quorvel_value_get_count(const quorvel_value* value) {
  if (const auto* list = contentOf<List>(value)) return list->size();
  const auto* dictionary = contentOf<Dictionary>(value);
  return dictionary ? dictionary->size() : 0;
}

const quorvel_value* quorvel_value_get_entry(const quorvel_value* value, size_t place) {
  if (place >= quorvel_value_get_count(value)) return nullptr;
  if (const auto* list = contentOf<List>(value)) return (*list)[place].get();
  return std::next(contentOf<Dictionary>(value)->begin(), static_cast<std::ptrdiff_t>(place))->second.get();
}

const char* quorvel_dictionary_get_key(const quorvel_value* dictionary, size_t place) {
  const auto* entries = contentOf<Dictionary>(dictionary);
  if (!entries || place >= entries->size()) return nullptr;
  return std::next(entries->begin(), static_cast<std::ptrdiff_t>(place))->first.c_str();
}

const quorvel_value* quorvel_dictionary_get(const quorvel_value* dictionary, const char* key) {
  const auto* entries = contentOf<Dictionary>(dictionary);
  const auto it = entries ? entries->find(key ? key : "") : Dictionary::const_iterator();
  return entries && it != entries->end() ? it->second.get() : nullptr;
}
