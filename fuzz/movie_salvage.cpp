// Files of the temporary store after a crash, which the daemon reads at its start.
#include "fuzz/MovieSeeds.h"
#include "fuzz/Target.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "tests/kit/ScratchFolder.h"

using namespace qv::platform;

std::vector<std::string> qv::fuzz::seeds() { return {growingMovie(1), growingMovie(3), finishedMovie(2)}; }

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const qv::kit::ScratchFolder folder("/dev/shm");  // a movie is synced several times
  const std::string input(reinterpret_cast<const char*>(data), size);
  const std::string path = folder.write("/movie.mp4", input);
  mp4::MP4MovieSalvage salvage;
  const auto length = salvage.salvageMovie(path);
  if (length && length.value() > MediaTime::zero()) {
    const auto state = salvage.stateOfMovie(path);
    qv::fuzz::require(state.hasValue(), "what was salvaged can be read");
    qv::fuzz::require(state.value() != MovieState::InUse, "what was salvaged is let go");
    qv::fuzz::require(state.value() == MovieState::Finished, "what was salvaged is finished");
  } else if (length) {
    qv::fuzz::require(folder.read("/movie.mp4") == input, "what needs or allows no salvage is left as it was");
  } else {
    qv::fuzz::require(input.starts_with(folder.read("/movie.mp4")), "a salvage that fails takes a torn end at most");
  }
  return 0;
}
