#pragma once

#include <map>
#include <mutex>
#include <string>
#include <utility>

#include "platform/Preferences.h"

namespace qv::fakes {

/// Preferences that the test sets.
///
/// Threading: thread-safe.
class FakePreferences final : public platform::PreferenceStore {
 public:
  void set(const std::string& domain, const std::string& key, platform::Value value) {
    std::lock_guard lock(mutex_);
    values_[{domain, key}] = std::move(value);
  }
  platform::Value valueForKey(const std::string& domain, const std::string& key) override {
    std::lock_guard lock(mutex_);
    const auto it = values_.find({domain, key});
    return it == values_.end() ? platform::Value() : it->second;
  }

 private:
  std::mutex mutex_;
  std::map<std::pair<std::string, std::string>, platform::Value> values_;
};

}  // namespace qv::fakes
