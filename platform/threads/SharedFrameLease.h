#pragma once

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"
#include "platform/base/SharedFrame.h"

namespace qv::platform {

/// Holds `frame` until the returned descriptor, and every copy of it in whatever process, is
/// closed: by release, or by the death of its holder. The descriptor travels with the frame.
///
/// A receiver that keeps leases would use up this process's descriptors, since a picture that stands still is sent
/// again and again. So at most kMaximumSharedFrameLeases are out: then the oldest is given up, and its holder's frame
/// may change from there on.
///
/// One thread of this process watches all leases; it begins with the first, and sleeps while none ends.
///
/// Threading: thread-safe.
Result<FileDescriptor> issueSharedFrameLease(SharedFrameRef frame);

/// As many as a screen capture has frames: a receiver that gives frames back never comes near it.
inline constexpr size_t kMaximumSharedFrameLeases = 14;

/// How many leases are out. For tests and diagnosis.
size_t outstandingSharedFrameLeases();

}  // namespace qv::platform
