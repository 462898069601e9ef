#pragma once

#include <cstdint>

namespace qv {

/// The kinds of samples, as clients and extensions are told them.
enum class SampleType : int64_t { Video = 1, AppAudio = 2, Microphone = 3 };

}  // namespace qv
