#include "support/QVReachability.h"
#include "support/QVStoreManager.h"
#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using platform::Dictionary;
using platform::Value;

class StoreTest : public SupportTest, public platform::StoreLookupService, public platform::NetworkReachabilityService {
 protected:
  void start(const platform::StoreLookupRequest& request, Handler handler) override {
    EXPECT_EQ(request.localizationStyle, 1);
    EXPECT_EQ(request.bundleIdentifiers, std::vector<std::string>{"com.example.chess"});
    const auto failure = results_.empty() ? std::optional(platform::Error::posix(ENOENT)) : std::nullopt;
    handler({results_}, failure);
  }
  std::unique_ptr<platform::NetworkReachabilityProbe> createProbe(const std::string&) override {
    struct Probe final : platform::NetworkReachabilityProbe {
      explicit Probe(std::optional<uint32_t> to) : answer(to) {}
      std::optional<uint32_t> flags() override { return answer; }
      const std::optional<uint32_t> answer;
    };
    return std::make_unique<Probe>(flags_);
  }
  QVStoreInfo load() {
    std::vector<QVStoreInfo> records;
    QVStoreManager(*this, main_, texts_)
        .loadItemDetailsForBundleIdentifier("com.example.chess",
                                            [&](const QVStoreInfo& info) { records.push_back(info); });
    EXPECT_TRUE(records.empty()) << "on the main queue, later";
    global_.runUntilIdle();
    EXPECT_EQ(records.size(), 1u);
    return records.at(0);
  }

  platform::SerialQueue main_{"main", global_};
  std::vector<platform::StoreLookupResult> results_;
  std::optional<uint32_t> flags_;
};

TEST_F(StoreTest, ARecordHoldsWhatTheCatalogueSaysAndTheNameOfTheInstalledApplication) {
  results_ = {{"appstream:x", "Chess", "Example", std::vector<std::string>{"Game", "BoardGame"}}, {}};
  EXPECT_EQ(load().dictionary(), (Dictionary{{"QVStoreInfoBundleIDKey", Value("com.example.chess")},
                                             {"QVStoreInfoAppNameKey", Value("Chess")},
                                             {"QVStoreInfoAuthorKey", Value("Example")},
                                             {"QVStoreInfoItemURLKey", Value("appstream:x")},
                                             {"QVStoreInfoCategoriesKey", Value("Game,BoardGame")}}));
  results_.clear();
  EXPECT_EQ(load().dictionary(), (Dictionary{{"QVStoreInfoBundleIDKey", Value("com.example.chess")},
                                             {"QVStoreInfoAuthorKey", Value("")},
                                             {"QVStoreInfoItemURLKey", Value("")}}));
  bundles_.addNamedApplication("Chess", "com.example.chess");
  results_ = {{std::nullopt, std::nullopt, "Example", std::vector<std::string>{}}};
  const QVStoreInfo info = load();
  EXPECT_EQ(info.appName, "Chess");
  EXPECT_FALSE(info.dictionary().contains("QVStoreInfoCategoriesKey"));
}

TEST_F(StoreTest, TheNetworkIsAvailableOnlyWhereItIsReachableWithoutMore) {
  const auto isAvailable = [this](std::optional<uint32_t> flags) {
    flags_ = flags;
    return QVReachability(*this).isNetworkAvailable();
  };
  EXPECT_TRUE(isAvailable(2));
  EXPECT_TRUE(isAvailable(2 | 1));
  EXPECT_FALSE(isAvailable(2 | 4));
  EXPECT_FALSE(isAvailable(0));
  EXPECT_FALSE(isAvailable(std::nullopt));
}

}  // namespace
}  // namespace qv
