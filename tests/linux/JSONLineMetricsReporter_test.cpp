#include "platform/linux/JSONLineMetricsReporter.h"

#include <gtest/gtest.h>

#include <filesystem>

#include "platform/linux/Json.h"
#include "tests/fakes/FakeClock.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

const std::string kDirectory = "/Library/Logs/Quorvel";
const std::string kFile = kDirectory + "/metrics.jsonl";

class JSONLineMetricsReporterTest : public testing::Test {
 protected:
  std::optional<Error> send(const std::string& text) {
    return reporter_.sendMessage({1, 1, 0, true, true, "Quorvel", "service", 3, 0, {{"text", Value(text)}}});
  }
  kit::ScratchFolder root_;
  fakes::FakeClock clock_;
  JSONLineMetricsReporter reporter_{root_.path(kDirectory), clock_};
};

TEST_F(JSONLineMetricsReporterTest, EachMessageIsOneLine) {
  EXPECT_EQ(send("two\nlines"), std::nullopt);
  EXPECT_EQ(send("second"), std::nullopt);
  const std::string content = root_.read(kFile);
  const size_t end = content.find('\n');
  const auto first = parseJSON(content.substr(0, end));
  ASSERT_TRUE(first);
  const Dictionary& message = first.value().asDictionary();
  EXPECT_EQ(valueForKey(message, "time").asDouble(), fakes::FakeClock::kStart);
  EXPECT_EQ(valueForKey(message, "clientName").asString(), "Quorvel");
  EXPECT_EQ(valueForKey(message, "category").asInteger(), 3);
  EXPECT_EQ(valueForKey(message, "payload"), Value(Dictionary{{"text", Value("two\nlines")}}));
  EXPECT_EQ(content.find('\n', end + 1), content.size() - 1);
  EXPECT_FALSE(message.contains("droppedPictures"));

  const auto second = parseJSON(content.substr(end + 1));
  ASSERT_TRUE(second);
  const std::string identifier = valueForKey(message, "id").asString();
  EXPECT_EQ(identifier.size(), 32u);
  EXPECT_NE(valueForKey(second.value().asDictionary(), "id").asString(), identifier);
}

TEST_F(JSONLineMetricsReporterTest, FullFilesAreRotatedAndTheOldestGoes) {
  const std::string large(600'000, 'x');  // two do not fit one file
  for (int number = 0; number < 7; ++number) EXPECT_EQ(send(std::to_string(number) + large), std::nullopt);
  for (int age = 0; age <= 4; ++age) {
    const std::string path = age == 0 ? kFile : kFile + "." + std::to_string(age);
    EXPECT_NE(root_.read(path).find("\"" + std::to_string(6 - age) + "xxx"), std::string::npos) << path;
  }
  EXPECT_FALSE(root_.exists(kFile + ".5"));
  EXPECT_TRUE(send(std::string(2'000'000, 'x'))) << "a line beyond every file";
}

TEST_F(JSONLineMetricsReporterTest, WriteErrorsAreReturned) {
  std::filesystem::create_directories(root_.path(kFile));
  const auto error = send("x");
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, EISDIR);
}

}  // namespace
}  // namespace qv::platform
