#pragma once

#include <atomic>
#include <memory>

namespace qv::c {

/// What C programs hold by references: `Public` is what they see of it, and begins it.
///
/// Threading: thread-safe; what it holds does not change.
template <typename Public>
struct Counted : Public {
  explicit Counted(const Public& seen = {}) : Public(seen) {}
  Counted(const Counted&) = delete;
  Counted& operator=(const Counted&) = delete;
  mutable std::atomic<int> references = 1;
};

template <typename Object, typename Public>
const Public* retain(const Public* object) {
  if (object != nullptr) static_cast<const Object*>(object)->references.fetch_add(1, std::memory_order_relaxed);
  return object;
}

template <typename Object, typename Public>
void release(const Public* object) {
  const auto* whole = static_cast<const Object*>(object);
  if (whole != nullptr && whole->references.fetch_sub(1, std::memory_order_acq_rel) == 1) delete whole;
}

/// One reference.
template <typename Object>
struct Release {
  void operator()(const Object* object) const { release<Object>(object); }
};
template <typename Object>
using Reference = std::unique_ptr<Object, Release<Object>>;

}  // namespace qv::c
