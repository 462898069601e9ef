#pragma once

#include <map>
#include <string>
#include <variant>
#include <vector>

#include "sdk/c/Counted.h"
#include "sdk/c/quorvel/quorvel.h"
#include "sdk/common/quorvel/Types.h"

/// A value as C programs build and read it. Those inside it are held by a reference each.
///
/// Threading: thread-safe once it is built; `references` always.
struct quorvel_value {
  using Reference = qv::c::Reference<const quorvel_value>;
  using List = std::vector<Reference>;
  using Dictionary = std::map<std::string, Reference, std::less<>>;
  using Content =
      std::variant<std::monostate, bool, int64_t, double, std::string, std::vector<uint8_t>, List, Dictionary>;

  template <typename T>
  explicit quorvel_value(T made) : content(std::in_place_type<T>, std::move(made)) {}
  Content content;
  mutable std::atomic<int> references = 1;
};

namespace qv::c {

quorvel_value::Reference valueFor(const quorvel::Value& value);
quorvel_value::Reference valueFor(const quorvel::Dictionary& dictionary);
/// The empty one where `value` is no dictionary, or nothing.
quorvel::Dictionary dictionaryOf(const quorvel_value* value);

}  // namespace qv::c
