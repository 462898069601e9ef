#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/base/FileDescriptor.h"

namespace qv {

/// The open movies that applications asked for and were not sent yet. Each costs the daemon a descriptor, for as long
/// as its application does not read the answer; so an application has 16 of them at most.
///
/// Threading: the manager's sequence.
class OutgoingMovies {
 public:
  static constexpr size_t kMaximum = 16;

  [[nodiscard]] bool hasRoomFor(const std::string& application) {
    std::erase_if(movies_, [](const auto& movie) { return movie.second.expired(); });
    size_t count = 0;
    for (const auto& [owner, movie] : movies_) count += owner == application ? 1 : 0;
    return count < kMaximum;
  }
  /// It counts until the last holder has let go of it.
  [[nodiscard]] platform::SharedFileDescriptor add(const std::string& application, platform::FileDescriptor movie) {
    auto shared = platform::shareFileDescriptor(std::move(movie));
    movies_.emplace_back(application, shared);
    return shared;
  }

 private:
  std::vector<std::pair<std::string, std::weak_ptr<const platform::FileDescriptor>>> movies_;
};

}  // namespace qv
