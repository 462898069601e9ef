#include "platform/appstream/AppStreamStore.h"

#include <gtest/gtest.h>

#include "tests/fakes/LogRecorder.h"
#include "tests/fakes/ManualExecutor.h"
#include "tests/fakes/ScratchPreferences.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::appstream {
namespace {

const std::string kFile = "/usr/share/swcatalog/xml/store.xml";

std::string catalogue(const std::string& components) {
  return R"(<?xml version="1.0" encoding="UTF-8"?><components version="0.14" origin="test">)" + components +
         "</components>";
}

std::string component(const std::string& id, const std::string& content) {
  return "<component type=\"desktop-application\"><id>" + id + "</id><summary>s</summary><pkgname>p</pkgname>" +
         content + "</component>";
}

class AppStreamStoreTest : public testing::Test {
 protected:
  struct Answer {
    StoreLookupResponse response;
    std::optional<Error> error;
  };
  Answer lookUp(std::vector<std::string> identifiers, const std::string& modules = QV_STORE_MODULE) {
    AppStreamStore store(root_.path(), localization_, executor_, modules);
    std::vector<Answer> answers;
    StoreLookupRequest request;
    request.bundleIdentifiers = std::move(identifiers);
    store.start(request, [&](const StoreLookupResponse& response, const std::optional<Error>& error) {
      answers.push_back({response, error});
    });
    executor_.runUntilIdle();
    EXPECT_EQ(answers.size(), 1u);
    return answers.at(0);
  }

  fakes::LogRecorder log_;
  kit::ScratchFolder root_;
  fakes::ScratchPreferences preferences_{root_.path("/preferences")};
  platform::Localization& localization_ = preferences_.localization;
  fakes::ManualExecutor executor_;
};

TEST_F(AppStreamStoreTest, FindsAnApplicationInTheUsersLanguage) {
  root_.write(kFile, catalogue(component("com.example.chess",
                                         "<name>Chess</name><name xml:lang=\"pt_BR\">Xadrez</name>"
                                         "<developer_name>Example</developer_name>"
                                         "<categories><category>Game</category><category>BoardGame</category>"
                                         "</categories>") +
                               component("com.example.old.desktop", "<name>Old</name>")));
  preferences_.setLanguages(R"(["pt-BR", "en"])");
  const auto answer = lookUp({"com.example.none", "com.example.chess", "com.example.old"});
  EXPECT_EQ(answer.error, std::nullopt);
  ASSERT_EQ(answer.response.results.size(), 2u);
  const StoreLookupResult& chess = answer.response.results[0];
  EXPECT_EQ(chess.displayName, "Xadrez");
  EXPECT_EQ(chess.artistName, "Example");
  EXPECT_EQ(chess.shortProductURL, "appstream:com.example.chess");
  EXPECT_EQ(chess.genreNames, (std::vector<std::string>{"Game", "BoardGame"}));
  EXPECT_EQ(answer.response.results[1].displayName, "Old");
  EXPECT_EQ(answer.response.results[1].artistName, std::nullopt);
  EXPECT_EQ(answer.response.results[1].genreNames, std::nullopt);
}

TEST_F(AppStreamStoreTest, HostileEntriesAreCutToPlainShortTexts) {
  std::string genres;
  for (int i = 0; i < 1000; ++i) genres += "<category>C" + std::to_string(i) + "</category><category>a,b</category>";
  std::string longName;
  for (int i = 0; i < 200'000; ++i) longName += "\u00e9";
  root_.write(kFile,
              catalogue(component("com.example.long", "<name>" + longName + "</name><categories>" + genres +
                                                          "</categories><developer_name>  \n </developer_name>") +
                        component("com.example.marks",
                                  "<name>a\u202e&lt;b&gt;\u200bc\nd</name><developer_name>\u202e</developer_name>")));
  root_.write("/var/lib/swcatalog/xml/broken.xml", "<components><component><id>com.example.broken");
  root_.write("/var/lib/swcatalog/yaml/broken.yml", "---\n\t- {{{");
  const auto answer = lookUp({"com.example.long", "com.example.marks", "com.example.broken", std::string(300, 'x')});
  ASSERT_EQ(answer.response.results.size(), 2u);
  const StoreLookupResult& cut = answer.response.results[0];
  EXPECT_EQ(cut.displayName, longName.substr(0, 256));
  EXPECT_EQ(cut.artistName, std::nullopt);
  ASSERT_TRUE(cut.genreNames);
  EXPECT_EQ(cut.genreNames->size(), 16u);
  EXPECT_EQ(cut.genreNames->back(), "C15");
  const std::string& name = answer.response.results[1].displayName.value();
  EXPECT_EQ(name.substr(0, 5), "a<b>c");
  EXPECT_EQ(name.find('\n'), std::string::npos);
  EXPECT_EQ(answer.response.results[1].artistName, std::nullopt);
}

TEST_F(AppStreamStoreTest, WithoutCatalogueOrModuleThereIsAnError) {
  EXPECT_TRUE(lookUp({"com.example.chess"}).error);
  EXPECT_TRUE(lookUp({"com.example.chess"}, root_.path()).error);
}

}  // namespace
}  // namespace qv::platform::appstream
