#include "support/QVDiskSpace.h"

#include "platform/Platform.h"
#include "support/QVTemporaryFiles.h"

namespace qv {
namespace {

platform::Result<uint64_t> freeBytes() {
  return platform::Platform::current().fileSystem->freeSizeOfFileSystem(_srTempPath());
}

}  // namespace

uint64_t _srDeviceFreeDiskSpace() {
  const auto bytes = freeBytes();
  return bytes ? bytes.value() : 0;
}

bool _srDeviceHasSufficientFreeSpaceForRecording() { return _srDeviceFreeDiskSpace() > kMinimumFreeSpaceForRecording; }

bool _srDeviceHasSufficientFreeSpaceToContinueRecording() {
  const auto bytes = freeBytes();
  return !bytes || bytes.value() >= kMinimumFreeSpaceWhileRecording;
}

}  // namespace qv
