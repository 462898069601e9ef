// Files of the temporary store after a crash, which the daemon reads at its start.
#include <endian.h>

#include <cstring>

#include "fuzz/MovieSeeds.h"
#include "fuzz/Target.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "tests/kit/ScratchFolder.h"

using namespace qv::platform;

std::vector<std::string> qv::fuzz::seeds() { return {growingMovie(1), growingMovie(3), finishedMovie(2)}; }

namespace {

/// What was there is there, but for the box behind the file type that a finish turns into the head of the media.
bool keepsAll(const std::string& before, const std::string& after) {
  constexpr size_t kHead = 16;
  uint32_t type = 0;
  std::memcpy(&type, before.data(), sizeof type);
  const size_t head = be32toh(type);
  return after.size() >= before.size() && after.compare(0, head, before, 0, head) == 0 &&
         after.compare(head + kHead, before.size() - head - kHead, before, head + kHead) == 0;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const qv::kit::ScratchFolder folder("/dev/shm");  // a movie is synced several times
  const std::string input(reinterpret_cast<const char*>(data), size);
  const std::string path = folder.write("/movie.mp4", input);
  mp4::MP4MovieSalvage salvage;
  const auto length = salvage.salvageMovie(path);
  const std::string output = folder.read("/movie.mp4");
  if (length && length.value() > MediaTime::zero()) {
    const auto state = salvage.stateOfMovie(path);
    qv::fuzz::require(state.hasValue(), "what was salvaged can be read");
    qv::fuzz::require(state.value() != MovieState::InUse, "what was salvaged is let go");
    qv::fuzz::require(state.value() == MovieState::Finished, "what was salvaged is finished");
    qv::fuzz::require(keepsAll(input, output), "a salvage takes nothing away");
  } else {
    qv::fuzz::require(output == input, "what is not salvaged is left as it was");
  }
  if (length && length.value() == MediaTime::zero())
    qv::fuzz::require(input.find("mdat") == std::string::npos, "what may go holds no media");
  return 0;
}
