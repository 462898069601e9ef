#pragma once

#include <algorithm>
#include <cstring>
#include <memory>
#include <string>
#include <type_traits>

#include "sdk/c/quorvel/quorvel.h"
#include "sdk/client/quorvel/Recorder.h"

/// The C program's recorder.
///
/// Threading: thread-safe, as the recorder is.
struct quorvel_recorder {
  std::unique_ptr<quorvel::Recorder> recorder;
};

namespace qv::c {

/// As much of a C program's options as both its header and this library know; the rest is as in `known`.
template <typename Options>
Options read(const Options* given, Options known) {
  static_assert(std::is_trivially_copyable_v<Options>);
  if (given != nullptr) std::memcpy(&known, given, std::min(given->size, sizeof known));
  return known;
}

inline std::string text(const char* given) { return given != nullptr ? given : ""; }

quorvel::Events eventsFor(const quorvel_events& events);
quorvel::Recorder::FailureHandler failureHandler(quorvel_error_handler handler, void* context);
quorvel::Recorder::CompletionHandler completionHandler(quorvel_error_handler handler, void* context);

}  // namespace qv::c
