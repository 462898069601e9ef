#pragma once

#include <cstdint>
#include <functional>
#include <optional>

#include "platform/base/Error.h"
#include "platform/base/Value.h"

namespace qv::platform {

enum class PhotoResourceType : int32_t { Video = 2 };

/// The user's library of photos and movies.
///
/// Threading: thread-safe. The completion comes on a thread of the library's.
class PhotoLibrary {
 public:
  virtual ~PhotoLibrary() = default;
  /// Adds a copy of the file; half a file never appears. No error on success.
  virtual void createAsset(const URL& file, PhotoResourceType type,
                           std::function<void(const std::optional<Error>&)> completion) = 0;
};

}  // namespace qv::platform
