// The names that the listings of docs/ take for known, around one of them.
#include <quorvel/BroadcastExtension.h>
#include <quorvel/Recorder.h>

struct Taker {
  void post(const std::function<void()>&) {}
  void encode(std::span<const uint8_t>, uint32_t, uint32_t, uint32_t, quorvel::SampleTime) {}
  void append(const std::vector<uint8_t>&, const quorvel::AudioFormat&, quorvel::SampleTime) {}
};

void guide([[maybe_unused]] quorvel::Recorder* recorder, [[maybe_unused]] quorvel::RecorderOptions options,
           [[maybe_unused]] uint32_t window, [[maybe_unused]] Taker loop, [[maybe_unused]] Taker encoder,
           [[maybe_unused]] Taker voice, [[maybe_unused]] Taker game,
           [[maybe_unused]] std::function<void(quorvel::StartResult)> started) {
  using namespace std::chrono_literals;
  do {
    // LISTING
  } while (false);
}
