#include "platform/linux/RouteReachability.h"

#include <netdb.h>

#include <future>
#include <map>
#include <mutex>
#include <utility>

#include "platform/linux/RouteTable.h"

namespace qv::platform {
namespace {

constexpr size_t kLongestName = 253;

using Answer = std::shared_future<std::optional<uint32_t>>;

}  // namespace

/// The best that holds for one of the host's addresses: a link that is up goes before one that is not.
uint32_t routeReachabilityOfHost(const std::string& host) {
  addrinfo hints{};
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* found = nullptr;
  if (::getaddrinfo(host.c_str(), nullptr, &hints, &found) != 0) return 0;
  const std::unique_ptr<addrinfo, decltype(&::freeaddrinfo)> addresses(found, &::freeaddrinfo);
  uint32_t best = 0;
  for (const addrinfo* address = found; address != nullptr; address = address->ai_next) {
    const uint32_t flags = reachabilityOfAddress(*address->ai_addr);
    if (flags == reachability::kReachable) return flags;
    best |= flags;
  }
  return best;
}

struct RouteReachabilityService::State {
  State(Executor& executorToUse, std::chrono::milliseconds time, HostReachability question)
      : executor(executorToUse), patience(time), ask(std::move(question)) {}
  Executor& executor;
  const std::chrono::milliseconds patience;
  const HostReachability ask;
  std::mutex mutex;
  std::map<std::string, Answer> running;  // guarded by mutex
};

/// Threading: one thread at a time.
class RouteReachabilityService::Probe final : public NetworkReachabilityProbe {
 public:
  Probe(std::shared_ptr<State> state, std::string host) : state_(std::move(state)), host_(std::move(host)) {}

  std::optional<uint32_t> flags() override {
    const auto answer = resolve();
    if (answer.wait_for(state_->patience) != std::future_status::ready) return std::nullopt;
    return answer.get();
  }

 private:
  Answer resolve() {
    std::lock_guard lock(state_->mutex);
    if (const auto running = state_->running.find(host_); running != state_->running.end()) return running->second;
    const auto promise = std::make_shared<std::promise<std::optional<uint32_t>>>();
    Answer answer = promise->get_future().share();
    state_->running[host_] = answer;
    state_->executor.post([state = state_, host = host_, promise] {
      const auto flags = state->ask(host);
      std::lock_guard done(state->mutex);
      state->running.erase(host);
      promise->set_value(flags);
    });
    return answer;
  }

  const std::shared_ptr<State> state_;
  const std::string host_;
};

RouteReachabilityService::RouteReachabilityService(Executor& executor, std::chrono::milliseconds patience,
                                                   HostReachability ask)
    : state_(std::make_shared<State>(executor, patience, std::move(ask))) {}

std::unique_ptr<NetworkReachabilityProbe> RouteReachabilityService::createProbe(const std::string& host) {
  if (host.empty() || host.size() > kLongestName || host.find('\0') != std::string::npos) return nullptr;
  return std::make_unique<Probe>(state_, host);
}

}  // namespace qv::platform
