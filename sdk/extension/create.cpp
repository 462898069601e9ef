#include <csignal>
#include <cstdio>
#include <cstdlib>

#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/Log.h"
#include "sdk/extension/ExtensionRuntime.h"
#include "sdk/extension/ListenerBroadcasts.h"

namespace quorvel {

namespace {

using namespace std::chrono_literals;

constexpr auto kLongestFarewell = 5s;

/// Nobody but the daemon reaches an extension: by its endpoints only.
qv::platform::SdBusIPCOptions messaging() { return qv::platform::optionsForTrustedPeers(); }

int run(qv::extension::ExtensionRuntime::Factory make) {
  const auto endpoints = qv::extension::ExtensionRuntime::inheritedEndpoints();
  if (!endpoints.requests.isValid() || !endpoints.auxiliary.isValid()) {
    std::fprintf(stderr, "a broadcast extension is launched by the recording daemon only\n");
    return 2;
  }
  // A server that closes its socket is an error of the write, not the end of the process.
  std::signal(SIGPIPE, SIG_IGN);
  qv::platform::SdBusIPCService ipc({}, messaging());
  const auto process = qv::extension::ExtensionRuntime::create(ipc, std::move(make));
  if (const auto error = process->start(endpoints)) {
    std::fprintf(stderr, "no connection to the recording daemon: %s\n", error->description().c_str());
    return 1;
  }
  process->waitForHost();
  if (!process->finish(kLongestFarewell)) {
    std::fprintf(stderr, "the extension did not return\n");
    qv::platform::flushLog();
    std::_Exit(1);
  }
  return 0;
}

}  // namespace

int runSampleExtension(SampleExtensionFactory make) { return run(std::move(make)); }
int runClipExtension(ClipExtensionFactory make) { return run(std::move(make)); }

std::unique_ptr<BroadcastListener> BroadcastListener::create(SampleExtensionFactory make) {
  auto ipc = std::make_unique<qv::platform::SdBusIPCService>(qv::platform::IPCPeerResolver(), messaging());
  return qv::extension::ListenerBroadcasts::create(std::move(ipc), std::move(make));
}

}  // namespace quorvel
