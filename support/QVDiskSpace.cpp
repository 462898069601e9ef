#include "support/QVDiskSpace.h"

#include <cerrno>

namespace qv {

bool isLackOfSpace(const std::optional<platform::Error>& failure) {
  return failure && failure->domain == platform::kPosixErrorDomain &&
         (failure->code == ENOSPC || failure->code == EDQUOT);
}

platform::Result<uint64_t> QVDiskSpace::freeBytes() const {
  return files_.disk().freeSizeOfFileSystem(files_._srTempPath());
}

uint64_t QVDiskSpace::_srDeviceFreeDiskSpace() const {
  const auto bytes = freeBytes();
  return bytes ? bytes.value() : 0;
}

bool QVDiskSpace::_srDeviceHasSufficientFreeSpaceForRecording() const {
  return _srDeviceFreeDiskSpace() > kMinimumFreeSpaceForRecording;
}

bool QVDiskSpace::_srDeviceHasSufficientFreeSpaceToContinueRecording() const {
  const auto bytes = freeBytes();
  return !bytes || bytes.value() >= kMinimumFreeSpaceWhileRecording;
}

}  // namespace qv
