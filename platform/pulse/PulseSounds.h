#pragma once

#include <string>

#include "platform/Sounds.h"

namespace qv::platform {

/// The system's sounds, made by itself: two rising notes (1117) and two falling ones (1118).
///
/// Threading: thread-safe. A sound is played by a job of the global queue that lasts at most 3 s.
class PulseSounds final : public SystemSounds {
 public:
  explicit PulseSounds(std::string server) : server_(std::move(server)) {}
  void play(uint32_t soundID) override;

 private:
  const std::string server_;
};

}  // namespace qv::platform
