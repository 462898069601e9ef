#pragma once

#include "platform/Extensions.h"
#include "protocol/QVBroadcastConfiguration.h"
#include "protocol/QVBroadcastProtocols.h"

namespace qv {

/// What a broadcast was set up with.
struct QVBroadcastInfo {
  platform::ExtensionRecordRef extension;
  BroadcastProcessMode extensionProcessMode = BroadcastProcessMode::MovieClips;
  platform::Dictionary extensionUserInfo;
  QVBroadcastConfiguration extensionConfiguration;
};

/// The broadcast of one recording.
struct BroadcastPlan {
  QVBroadcastInfo info;
  /// Of an extension that runs already; else it is launched.
  platform::ListenerEndpoint listenerEndpoint;
};

}  // namespace qv
