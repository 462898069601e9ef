#pragma once

#include <optional>
#include <string>

#include "platform/Error.h"

namespace qv::platform::mp4 {

/// Finishes the movie that a crash left at `path`, in the time of its index: a torn last fragment is
/// cut off and the index appended, as a finish would have. A movie that is finished already stays
/// as it is.
///
/// An error where the file is none of ours or holds no whole picture; it is then left untouched.
///
/// Threading: any; the file is nobody else's meanwhile.
std::optional<Error> salvageMovie(const std::string& path);

}  // namespace qv::platform::mp4
