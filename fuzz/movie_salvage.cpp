// Files of the temporary store after a crash, which the daemon reads at its start.
#include "fuzz/MovieSeeds.h"
#include "fuzz/Target.h"
#include "platform/mp4/MP4MovieSalvage.h"

using namespace qv::platform;

std::vector<std::string> qv::fuzz::seeds() { return {growingMovie(1), growingMovie(3), finishedMovie(2)}; }

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const qv::fuzz::ScratchFile file;
  const std::string input(reinterpret_cast<const char*>(data), size);
  file.write(input);
  mp4::MP4MovieSalvage salvage;
  const auto length = salvage.salvageMovie(file.path());
  if (length && length.value() > MediaTime::zero()) {
    const auto state = salvage.stateOfMovie(file.path());
    qv::fuzz::require(state.hasValue(), "what was salvaged can be read");
    qv::fuzz::require(state.value() != MovieState::InUse, "what was salvaged is let go");
    qv::fuzz::require(state.value() == MovieState::Finished, "what was salvaged is finished");
  } else if (length) {
    qv::fuzz::require(file.read() == input, "what needs or allows no salvage is left as it was");
  } else {
    qv::fuzz::require(input.starts_with(file.read()), "a salvage that fails takes a torn end at most");
  }
  return 0;
}
