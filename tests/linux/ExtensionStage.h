#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/ICULocalization.h"
#include "platform/linux/JSONPreferenceStore.h"
#include "platform/linux/LinuxExtensionService.h"
#include "platform/linux/LocalExtensionStarter.h"
#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/Executor.h"
#include "tests/fakes/ManualTimers.h"
#include "tests/kit/Events.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {

inline constexpr const char kPoint[] = "com.tarnwick.broadcast-services-upload";
inline constexpr const char kReadOnly[] = "com.tarnwick.quorveld.read-only";
inline const std::string kUploadBundle = "/Applications/Game/PlugIns/Upload";

inline const std::string kUploadContainer = "/private/var/mobile/Containers/com.example.game.upload";

inline std::string infoOf(const std::string& identifier, const std::string& executable = "bin/up") {
  return R"({"CFBundleIdentifier":")" + identifier + R"(","CFBundleName":"Upload","QVExtension":{
      "QVExtensionPointIdentifier":")" +
         kPoint + R"(","QVExtensionExecutable":")" + executable +
         R"(","QVExtensionIcons":["icon.png","../../up"],
      "QVExtensionAttributes":{"QVExtensionActivationRule":{"x":true}}}})";
}

/// One request as its owner sees it.
struct Flow {
  kit::Events<std::pair<ExtensionRequestID, int64_t>> began;  ///< and its error's code
  kit::Events<std::string> completed;                         ///< the first item's title, or the error
};

/// A device with one extension, which does what its requests say (linux_test_extension.cpp), and the service that runs
/// it.
///
/// Threading: the test's thread.
class ExtensionStage : public ::testing::Test {
 protected:
  using MakeStarter = std::function<std::unique_ptr<ExtensionStarter>(const std::string& root)>;

  explicit ExtensionStage(const MakeStarter& makeStarter = startHere)
      : service_(ipc_, bundles_, timers_, globalQueue(), makeStarter(root_.path())) {
    ::chmod(root_.path().c_str(), 0755);
    install(kUploadBundle, "com.example.game.upload");
  }
  static std::unique_ptr<ExtensionStarter> startHere(const std::string& root) {
    return std::make_unique<LocalExtensionStarter>(
        ExtensionLaunchOptions{.dataDirectory = root + "/private/var/mobile", .launcherPath = EXTENSION_LAUNCHER});
  }
  void install(const std::string& bundle, const std::string& identifier) {
    root_.write(bundle + "/Info.json", infoOf(identifier));
    std::filesystem::create_directories(root_.path(bundle + "/bin"));
    std::filesystem::copy_file(TEST_EXTENSION, root_.path(bundle + "/bin/up"));
  }
  std::vector<ExtensionRecordRef> find(const Dictionary& attributes = {{extensioninfo::kPointIdentifier, kPoint}}) {
    kit::Events<std::vector<ExtensionRecordRef>> found;
    service_.extensionsMatchingAttributes(
        attributes, [&](const std::vector<ExtensionRecordRef>& records, const auto&) { found.add(records); });
    return found.next();
  }
  std::shared_ptr<Flow> begin(const std::string& command, const std::string& argument = {}) {
    return beginOn(use(), command, argument);
  }
  ExtensionUse& use() {
    if (!extension_) extension_ = find().at(0);
    if (!use_) use_ = service_.useExtension(extension_);
    return *use_;
  }
  static std::shared_ptr<Flow> beginOn(ExtensionUse& use, const std::string& command,
                                       const std::string& argument = {}) {
    const auto flow = std::make_shared<Flow>();
    use.beginRequest({{command, {{kGenericDataType, Value(argument)}}}},
                     {.began =
                          [flow](auto id, const auto& error) {
                            flow->began.add({id, error ? error->code : 0});
                          },
                      .completed =
                          [flow](auto, const auto& items) {
                            flow->completed.add(items ? items.value().at(0).attributedTitle
                                                      : "error " + std::to_string(items.error().code));
                          }});
    return flow;
  }
  std::string run(const std::string& command, const std::string& argument = {}) {
    const auto flow = begin(command, argument);
    EXPECT_EQ(flow->began.next().second, 0) << root_.read(kUploadContainer + "/stderr.log");
    return flow->completed.next();
  }
  /// Whether the kernel kept the extension from it, in whatever words.
  bool isRefused(const std::string& command, const std::string& argument = {}) {
    const std::string answer = run(command, argument);
    for (const int number : {EACCES, ENOENT, EPERM, ENOSYS, EROFS}) {
      if (answer == "errno " + std::to_string(number)) return true;
    }
    ADD_FAILURE() << command << " " << argument << ": " << answer;
    return false;
  }
  static std::string failure(int code) { return "error " + std::to_string(code); }

  kit::ScratchFolder root_;
  JSONPreferenceStore preferences_{root_.path()};
  ICULocalization localization_{preferences_, "com.example.test"};
  LinuxBundleService bundles_{root_.path(), "", localization_};
  SdBusIPCService ipc_;
  fakes::ManualTimers timers_;
  ExtensionRecordRef extension_;
  LinuxExtensionService service_;
  std::shared_ptr<ExtensionUse> use_;
};

}  // namespace qv::platform
