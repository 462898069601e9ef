#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <memory>
#include <utility>

#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/SerialQueue.h"
#include "protocol/Calls.h"
#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "tests/fakes/AcceptingDelegate.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::client {

/// A daemon of the test's in this process, behind the real socket: for the libraries as applications get them.
class DaemonSocket : public ::testing::Test {
 protected:
  DaemonSocket() {
    ::setenv("XDG_RUNTIME_DIR", folder_.path().c_str(), 1);
    service_ = std::make_unique<platform::SdBusIPCService>();
    listener_ = service_->createListener(kServiceName);
    listener_->setDelegate(&daemon_, queue_);
    EXPECT_FALSE(listener_->resume());
  }
  ~DaemonSocket() override { stopDaemon(); }
  void stopDaemon() {
    if (daemonEnd_) daemonEnd_->invalidate();
    daemonEnd_.reset();
    listener_.reset();
    service_.reset();
    queue_.sync([] {});
  }
  void send(OutgoingCall call) { daemonEnd_->call(call.member, std::move(call.arguments), {}, {}); }

  const kit::ScratchFolder folder_;
  platform::SerialQueue queue_{"test daemon"};
  fakes::AcceptingDelegate daemon_{daemonProtocol(), clientProtocol()};
  std::unique_ptr<platform::SdBusIPCService> service_;
  std::unique_ptr<platform::IPCListener> listener_;
  std::shared_ptr<platform::IPCConnection> daemonEnd_;
};

}  // namespace qv::client
