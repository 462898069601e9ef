#include "platform/pulse/PulsePlatform.h"

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "platform/pulse/PulseMicrophone.h"
#include "platform/pulse/PulseSession.h"
#include "platform/pulse/PulseSounds.h"
#include "platform/pulse/PulseTapSource.h"

namespace qv::platform {
namespace {

constexpr std::chrono::milliseconds kConnectLimit{1000};

/// Threading: thread-safe.
class ProcessScreenReader final : public ScreenReader {
 public:
  bool isRunning() override {
    std::error_code error;
    for (std::filesystem::directory_iterator entry("/proc", error), end; !error && entry != end;
         entry.increment(error)) {
      std::ifstream file(entry->path() / "comm");
      std::string name;
      if (std::getline(file, name) && name == "orca") return true;
    }
    return false;
  }
};

}  // namespace

Result<std::unique_ptr<PulsePlatform>> PulsePlatform::connect(const std::string& server) {
  if (!PulseSession(server, kConnectLimit).isConnected()) return Error::posix(ECONNREFUSED, "sound server");
  return std::unique_ptr<PulsePlatform>(new PulsePlatform(server));
}

PulsePlatform::PulsePlatform(const std::string& server)
    : appAudioTap_([server](pid_t process, const PCMFormat& format) -> std::unique_ptr<PCMSource> {
        return std::make_unique<PulseTapSource>(server, process, format);
      }),
      deviceCapture_({.isAvailable = [server] { return serverHasMicrophone(server); },
                      .open = [server](const PCMFormat& format) -> std::unique_ptr<PCMSource> {
                        return std::make_unique<PulseMicrophone>(server, format);
                      }}),
      sounds_(std::make_unique<PulseSounds>(server)),
      screenReader_(std::make_unique<ProcessScreenReader>()) {}

PulsePlatform::~PulsePlatform() = default;

}  // namespace qv::platform
