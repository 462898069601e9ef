#include "extensions/QVExtensions.h"

#include "tests/fakes/FakeDevice.h"

namespace qv {
namespace {

using platform::Dictionary;
using platform::Value;
namespace extensioninfo = platform::extensioninfo;

class QVExtensionsTest : public testing::Test {
 protected:
  void install(const std::string& identifier, std::optional<Value> rules) {
    auto record = std::make_shared<platform::ExtensionRecord>();
    record->identifier = identifier;
    record->extensionPointIdentifier = "point";
    if (rules) record->attributes[extensioninfo::kActivationRule] = *rules;
    device_.extensions.installed.push_back(record);
  }
  std::string found(ExtensionQuery query) {
    std::string names;
    extensionsWithMatchingPointName(device_.platform.extensions, std::move(query),
                                    [&](const auto& extensions, const auto& error) {
                                      for (const auto& extension : extensions) names += extension->identifier + " ";
                                      if (error) names += "error";
                                    });
    device_.run();
    return names;
  }
  fakes::FakeDevice device_;
};

TEST_F(QVExtensionsTest, EachOptionalParameterRestrictsAsItSays) {
  install("a.b.c", std::nullopt);
  install("a.bc.d", Value("no dictionary"));
  install("A.b.c", Value(Dictionary{{"on", Value(true)}, {"off", Value(false)}}));
  install("a.b.x", Value(Dictionary{{"on", Value(int32_t{1})}}));
  EXPECT_EQ(found({.pointName = "point"}), "a.b.c a.bc.d A.b.c a.b.x ");
  EXPECT_EQ(found({.pointName = "other"}), "");
  EXPECT_EQ(found({.pointName = "point", .baseIdentifier = "a.b"}), "a.b.c a.bc.d a.b.x ");
  EXPECT_EQ(found({.pointName = "point", .activationRule = "on"}), "A.b.c a.b.x ");
  EXPECT_EQ(found({.pointName = "point", .activationRule = "off"}), "");
  EXPECT_EQ(found({.pointName = "point", .unwantedActivationRule = "off"}), "a.b.c a.bc.d A.b.c a.b.x ");
  EXPECT_EQ(found({.pointName = "point", .unwantedActivationRule = "on"}), "a.b.c a.bc.d ");
  EXPECT_EQ(found({.pointName = "point", .baseIdentifier = "a.b.", .unwantedActivationRule = "on"}), "a.b.c ");
  device_.extensions.installed.clear();
  device_.extensions.queryError = platform::Error{"d", 3, {}};
  EXPECT_EQ(found({.pointName = "point"}), "error");
  extensionsWithMatchingPointName(&device_.extensions, {}, nullptr);
  device_.run();
}

TEST_F(QVExtensionsTest, WithoutAServiceThereIsAnError) {
  int64_t code = 0;
  extensionsWithMatchingPointName(nullptr, {}, [&](const auto&, const auto& error) { code = error->code; });
  EXPECT_EQ(code, ENOTSUP);
  extensionsWithMatchingPointName(nullptr, {}, nullptr);
}

TEST_F(QVExtensionsTest, OnlyTheDeclaredSampleModeIsOne) {
  EXPECT_EQ(processMode(*device_.extensions.install("a", "p", "QVBroadcastProcessModeSampleBuffer")),
            BroadcastProcessMode::Samples);
  EXPECT_EQ(processMode(*device_.extensions.install("a", "p", "anything")), BroadcastProcessMode::MovieClips);
  EXPECT_EQ(processMode(platform::ExtensionRecord{}), BroadcastProcessMode::MovieClips);
}

}  // namespace
}  // namespace qv
