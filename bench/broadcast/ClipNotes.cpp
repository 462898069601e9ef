// A broadcast extension in clip mode that only notes what came: a line for each clip in its container's log.

#include <quorvel/BroadcastExtension.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <string>

namespace {

uint64_t bigEndian(const std::string& bytes, size_t at, size_t size) {
  uint64_t value = 0;
  for (size_t i = at; i < at + size; ++i) value = value << 8 | static_cast<uint8_t>(bytes[i]);
  return value;
}

std::string contentsOf(int file) {
  struct stat status {};
  if (::fstat(file, &status) != 0) return {};
  std::string bytes(static_cast<size_t>(status.st_size), '\0');
  const ssize_t got = ::pread(file, bytes.data(), bytes.size(), 0);
  bytes.resize(got > 0 ? static_cast<size_t>(got) : 0);
  return bytes;
}

/// Seconds, as the index at the movie's end says (`mvhd` version 1, ISO/IEC 14496-12, 8.2.2); 0 where there is none.
double durationOf(const std::string& movie) {
  constexpr size_t kTimescale = 24, kDuration = 28, kEnd = 36;  // bytes from the box's type on
  const size_t header = movie.rfind("mvhd");
  if (header == std::string::npos || header + kEnd > movie.size()) return 0;
  const uint64_t timescale = bigEndian(movie, header + kTimescale, 4);
  return timescale == 0 ? 0 : static_cast<double>(bigEndian(movie, header + kDuration, 8)) / timescale;
}

class ClipNotes final : public quorvel::ClipExtension {
 public:
  void processClip(quorvel::Clip clip, quorvel::ClipCompletion done) override {
    const std::string movie = contentsOf(clip.file);
    std::printf("clip name=%s last=%d bytes=%zu seconds=%.3f\n", clip.name.c_str(), clip.isLast, movie.size(),
                durationOf(movie));
    std::fflush(stdout);
    done({});
  }
};

}  // namespace

int main() { return quorvel::runExtension<ClipNotes>(); }
