#include "support/QuorvelErrors.h"

#include <utility>

#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using platform::Dictionary;
using platform::kLocalizedDescriptionKey;
using platform::Value;

class ErrorsTest : public SupportTest {};

TEST_F(ErrorsTest, TheFirstAndTheLastCodeHaveTheirKeyAndOthersAreUnknown) {
  // Without an entry a table shows the key, which tells the pairs apart.
  addTable("en", "");
  for (const auto& [code, key] : {std::pair<int64_t, const char*>{-5800, "RECORDING_ERROR_UNKNOWN"},
                                  {0, "RECORDING_ERROR_UNKNOWN"},
                                  {kRecordingErrors.back().code - 1, "RECORDING_ERROR_UNKNOWN"},
                                  {INT64_MIN, "RECORDING_ERROR_UNKNOWN"},
                                  {INT64_MAX, "RECORDING_ERROR_UNKNOWN"},
                                  {-5801, "RECORDING_ERROR_USER_DECLINED"},
                                  {kRecordingErrors.back().code, kRecordingErrors.back().key}}) {
    const auto error = QuorvelErrors(texts_)._qvUserErrorForCode(code);
    EXPECT_EQ(error.domain, "com.tarnwick.Quorvel.QVRecordingErrorDomain");
    EXPECT_EQ(error.code, code);
    EXPECT_EQ(error.userInfo, (Dictionary{{kLocalizedDescriptionKey, Value(key)}}));
  }
}

TEST_F(ErrorsTest, TheTextReplacesTheCallersAndOtherEntriesStay) {
  const Dictionary userInfo{{kLocalizedDescriptionKey, Value("mine")}, {"file", Value("a.mp4")}};
  EXPECT_EQ(QuorvelErrors(texts_)._qvUserErrorForCode(errorcode::kFailed, userInfo).userInfo,
            userInfo);  // no framework, no text
  addTable("en", R"("RECORDING_ERROR_FAILED" = "It failed.";)");
  const auto error = QuorvelErrors(texts_)._qvUserErrorForCode(errorcode::kFailed, userInfo);
  EXPECT_EQ(error.localizedDescription(), "It failed.");
  EXPECT_EQ(platform::valueForKey(error.userInfo, "file").asString(), "a.mp4");
}

TEST_F(ErrorsTest, OnlyWhatIsOursAndHasNoTextGetsOneOnItsWayToAClient) {
  addTable("en", R"("RECORDING_ERROR_FAILED" = "It failed.";)");
  const QuorvelErrors errors(texts_);
  const auto sent = [&](const std::optional<platform::Error>& error) {
    const auto received = platform::decodeError(errors.encoded(error));
    return received ? received->localizedDescription() : "none";
  };
  EXPECT_EQ(sent(recordingError(errorcode::kFailed)), "It failed.");
  EXPECT_EQ(sent(platform::Error{kQVRecordingErrorDomain, errorcode::kFailed, {{kLocalizedDescriptionKey, "mine"}}}),
            "mine");
  EXPECT_EQ(sent(platform::Error{"other", errorcode::kFailed, {}}), "");
  EXPECT_EQ(sent(std::nullopt), "none");
}

}  // namespace
}  // namespace qv
