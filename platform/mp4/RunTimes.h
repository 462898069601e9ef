#pragma once

#include <cstdint>
#include <vector>

#include "platform/mp4/FragmentReader.h"

namespace qv::platform::mp4 {

/// The decode times of one track's samples, run by run. They rise strictly, as an index needs it, and by what it can
/// hold at most. A run whose own time does not fit between those of the others has lost it to damage, and follows the
/// run before it.
std::vector<std::vector<int64_t>> timesOf(const std::vector<SampleRun>& runs);

}  // namespace qv::platform::mp4
