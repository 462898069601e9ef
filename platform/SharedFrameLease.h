#pragma once

#include "platform/FileDescriptor.h"
#include "platform/Result.h"
#include "platform/SharedFrame.h"

namespace qv::platform {

/// Holds `frame` until the returned descriptor, and every copy of it in whatever process, is
/// closed: by release, or by the death of its holder. The descriptor travels with the frame.
///
/// One thread of this process watches all leases; it sleeps while none ends.
///
/// Threading: thread-safe.
Result<FileDescriptor> issueSharedFrameLease(SharedFrameRef frame);

/// How many leases are out. For tests and diagnosis.
size_t outstandingSharedFrameLeases();

}  // namespace qv::platform
