#include "platform/pulse/PulsePlatform.h"

#include <cerrno>

#include "platform/pulse/PulseMicrophone.h"
#include "platform/pulse/PulseSession.h"
#include "platform/pulse/PulseSounds.h"
#include "platform/pulse/PulseTapSource.h"

namespace qv::platform {
namespace {

constexpr std::chrono::milliseconds kConnectLimit{1000};

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
      sounds_(std::make_unique<PulseSounds>(server)) {}

PulsePlatform::~PulsePlatform() = default;

}  // namespace qv::platform
