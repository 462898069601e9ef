#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

/// A fuzz target is a program of one source that defines these two. It runs under libFuzzer, or
/// under Driver.cpp where the compiler has none (fuzz/CMakeLists.txt).
///
/// Takes any input; a broken promise of the parser aborts.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

namespace qv::fuzz {

/// Valid inputs, from which the driver makes broken ones.
std::vector<std::string> seeds();

inline void require(bool holds, const char* promise) {
  if (holds) return;
  std::fprintf(stderr, "broken promise: %s\n", promise);
  std::abort();
}

}  // namespace qv::fuzz
