#pragma once

#include <string>

namespace qv::fuzz {

/// A small movie with pictures and sound as a crash leaves it after a number of whole fragments; its media is no
/// real stream.
std::string growingMovie(int fragments);
/// The same after its finish.
std::string finishedMovie(int fragments);

}  // namespace qv::fuzz
