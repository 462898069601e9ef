#pragma once

#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/Applications.h"
#include "platform/DeviceServices.h"
#include "platform/Entitlements.h"
#include "platform/FileSystem.h"
#include "platform/IPC.h"
#include "platform/KeepAlive.h"
#include "platform/Metrics.h"
#include "platform/PhotoLibrary.h"
#include "platform/PurgeableSpace.h"
#include "platform/RenderServer.h"
#include "platform/ScreenReader.h"
#include "platform/Sounds.h"
#include "platform/StatusBar.h"
#include "platform/UserAlert.h"

namespace qv::fakes {

/// Services that answer, until the test says otherwise.
class FakeDeviceServices final : public platform::DeviceServicesQuery {
 public:
  platform::DeviceServices look() override {
    ++looks;
    return found;
  }
  platform::DeviceServices found{{"X11"}, {"PulseAudio"}, {"libavcodec"}};
  int looks = 0;
};

/// By bundle identifier, for every user.
class FakeEntitlements final : public platform::EntitlementQuery {
 public:
  [[nodiscard]] platform::Dictionary entitlementsForBundle(const std::string& bundle, uid_t) const override {
    const auto found = all.find(bundle);
    return found == all.end() ? platform::Dictionary() : found->second;
  }
  std::map<std::string, platform::Dictionary> all;
};

/// Alerts stay until the test answers them.
class FakeUserAlerts final : public platform::UserAlertService {
 public:
  struct Shown {
    platform::UserAlertRequest request;
    std::function<void(platform::UserAlertAnswer)> handler;
    bool visible = true;
  };
  struct Alert final : platform::UserAlert {
    explicit Alert(std::shared_ptr<Shown> to) : shown(std::move(to)) {}
    ~Alert() override { shown->visible = false; }
    const std::shared_ptr<Shown> shown;
  };
  std::unique_ptr<platform::UserAlert> present(const platform::UserAlertRequest& request,
                                               std::function<void(platform::UserAlertAnswer)> handler) override {
    if (fails) return nullptr;
    shown.push_back(std::make_shared<Shown>(Shown{request, std::move(handler)}));
    return std::make_unique<Alert>(shown.back());
  }
  void answer(platform::UserAlertAnswer answer) { shown.back()->handler(answer); }

  std::vector<std::shared_ptr<Shown>> shown;
  bool fails = false;
};

/// What it shows stands in `shown`; the test presses it.
class FakeStatusBar final : public platform::StatusBarOverrideCoordinator {
 public:
  struct Override final : platform::StatusBarOverrideAssertion {
    explicit Override(FakeStatusBar& to) : bar(to) {}
    ~Override() override { bar.shown.reset(); }
    void update(const platform::StatusBarOverride& now) override { bar.shown = now; }
    FakeStatusBar& bar;
  };
  std::unique_ptr<platform::StatusBarOverrideAssertion> acquire(
      const platform::StatusBarOverride& now,
      std::weak_ptr<platform::StatusBarOverrideCoordinatorDelegate> to) override {
    shown = now;
    delegate = std::move(to);
    return std::make_unique<Override>(*this);
  }
  void press() {
    if (const auto to = delegate.lock()) to->statusBarOverrideWasPressed();
  }

  std::optional<platform::StatusBarOverride> shown;
  std::weak_ptr<platform::StatusBarOverrideCoordinatorDelegate> delegate;
};

class FakeApplications final : public platform::ApplicationService, public platform::RenderServer {
 public:
  struct Monitor final : platform::ApplicationStateMonitor {
    explicit Monitor(FakeApplications& to) : applications(to) {}
    uint32_t applicationStateForBundleIdentifier(const std::string& bundleID) override {
      const auto it = applications.states.find(bundleID);
      return it == applications.states.end() ? 0 : it->second;
    }
    void applicationInfoForBundleIdentifier(const std::string& bundleID,
                                            std::function<void(platform::Dictionary)> handler) override {
      const auto it = applications.processes.find(bundleID);
      platform::Dictionary information;
      if (it != applications.processes.end()) {
        information[platform::applicationstate::kProcessIDKey] = platform::Value(int32_t{it->second});
      }
      handler(std::move(information));
    }
    void setHandler(std::function<void(const platform::Dictionary&)> to) override {
      applications.handler = std::move(to);
    }
    FakeApplications& applications;
  };
  std::unique_ptr<platform::ApplicationStateMonitor> createStateMonitor() override {
    return std::make_unique<Monitor>(*this);
  }
  std::optional<std::string> frontmostApplication() override { return frontmost; }
  std::optional<pid_t> ownerOfContext(uint32_t contextID) override {
    ++ownersAsked;
    const auto it = owners.find(contextID);
    return it == owners.end() ? std::nullopt : std::optional(it->second);
  }
  void report(uint32_t state, int32_t process, bool isFrontmost) {
    namespace keys = platform::applicationstate;
    handler({{keys::kStateKey, platform::Value(state)},
             {keys::kProcessIDKey, platform::Value(process)},
             {keys::kIsFrontmostKey, platform::Value(isFrontmost)}});
  }

  std::map<std::string, uint32_t> states;
  std::map<std::string, pid_t> processes;
  std::map<uint32_t, pid_t> owners;
  int ownersAsked = 0;
  std::optional<std::string> frontmost;
  std::function<void(const platform::Dictionary&)> handler;
};

class FakeSounds final : public platform::SystemSounds, public platform::ScreenReader {
 public:
  void play(uint32_t soundID) override { played.push_back(soundID); }
  bool isRunning() override { return false; }
  std::vector<uint32_t> played;
};

class FakeKeepAlive final : public platform::KeepAliveService {
 public:
  void beginTransaction() override { ++begun, ++count; }
  void endTransaction() override { --count; }
  int begun = 0, count = 0;
};

class FakePurgeableSpace final : public platform::PurgeableSpaceService {
 public:
  void registerCallbacks(const std::string&, platform::PurgeableSpaceCallbacks to) override {
    callbacks = std::move(to);
  }
  platform::PurgeableSpaceCallbacks callbacks;
};

/// Answers at once or, while `holds`, when the test says. It reads the file when it answers, as a copy that takes long
/// still does.
class FakePhotoLibrary final : public platform::PhotoLibrary {
 public:
  using Completion = std::function<void(const std::optional<platform::Error>&)>;
  explicit FakePhotoLibrary(platform::FileSystem& disk) : disk_(disk) {}
  void createAsset(const platform::URL& file, platform::PhotoResourceType, Completion completion) override {
    stored.push_back(file);
    held.push_back({file, std::move(completion)});
    if (!holds) answer();
  }
  /// Answers the oldest request that is held back.
  void answer() {
    const auto [file, completion] = std::move(held.front());
    held.pop_front();
    const auto content = disk_.readFile(file.path());
    if (!failure && content) contents.push_back(content.value());
    completion(failure);
  }
  /// The completion of the oldest is never called.
  void drop() { held.pop_front(); }

  std::vector<platform::URL> stored;  ///< or refused
  std::vector<std::string> contents;  ///< of what was stored and there
  std::optional<platform::Error> failure;
  bool holds = false;

  struct Request {
    platform::URL file;
    Completion completion;
  };
  std::deque<Request> held;

 private:
  platform::FileSystem& disk_;
};

class FakeMetrics final : public platform::MetricsReporter {
 public:
  std::optional<platform::Error> sendMessage(const platform::MetricsMessage& message) override {
    messages.push_back(message);
    return std::nullopt;
  }
  std::vector<platform::MetricsMessage> messages;
};

}  // namespace qv::fakes
