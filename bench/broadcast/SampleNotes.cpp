// A broadcast extension in sample mode that only notes what came, and tells it at the end in its container's log:
// how late each picture was, and in which memory files pictures lay.

#include <quorvel/BroadcastExtension.h>

#include <cinttypes>
#include <cstdio>
#include <set>
#include <string>
#include <vector>

namespace {

constexpr size_t kMostPictures = 1 << 20;
constexpr size_t kLookInterval = 10;  // pictures; to look for the memory file takes a fraction of a millisecond

std::chrono::nanoseconds now() { return std::chrono::steady_clock::now().time_since_epoch(); }

/// "INODE:RIGHTS" of the mapping that begins at or before `address` and holds it; empty where there is none.
std::string memoryFileAt(uintptr_t address) {
  std::FILE* maps = std::fopen("/proc/self/maps", "re");
  if (maps == nullptr) return {};
  std::string found;
  char line[512];
  while (found.empty() && std::fgets(line, sizeof line, maps) != nullptr) {
    uintptr_t begin = 0, end = 0;
    uint64_t inode = 0;
    char rights[5] = {};
    if (std::sscanf(line, "%" SCNxPTR "-%" SCNxPTR " %4s %*x %*s %" SCNu64, &begin, &end, rights, &inode) == 4 &&
        begin <= address && address < end)
      found = std::to_string(inode) + ":" + rights;
  }
  std::fclose(maps);
  return found;
}

class SampleNotes final : public quorvel::SampleExtension {
 public:
  explicit SampleNotes(quorvel::Broadcast&) { latencies_.reserve(kMostPictures); }

  void started(quorvel::Dictionary) override {}

  void processVideo(quorvel::VideoFrame frame, quorvel::Orientation) override {
    latencies_.push_back(now() - frame.presentationTime);
    if (latencies_.size() % kLookInterval == 0)
      files_.insert(memoryFileAt(reinterpret_cast<uintptr_t>(frame.pixels.data())));
  }

  void processAudio(quorvel::AudioSample) override { ++sounds_; }

  void finished() override {
    std::printf("sounds %zu\nfiles", sounds_);
    for (const std::string& file : files_) std::printf(" %s", file.c_str());
    std::printf("\nmicroseconds");
    for (const auto latency : latencies_) std::printf(" %" PRId64, int64_t{latency.count() / 1000});
    std::printf("\n");
    std::fflush(stdout);
  }

 private:
  std::vector<std::chrono::nanoseconds> latencies_;  ///< from capture to this call
  std::set<std::string> files_;
  size_t sounds_ = 0;
};

}  // namespace

int main() { return quorvel::runExtension<SampleNotes>(); }
