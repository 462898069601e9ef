#include "support/QuorvelErrors.h"

#include <utility>

#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using platform::Dictionary;
using platform::kLocalizedDescriptionKey;
using platform::Value;

class ErrorsTest : public SupportTest {};

TEST_F(ErrorsTest, EveryCodeHasItsKeyAndOthersAreUnknown) {
  // Without an entry a table shows the key, which tells the pairs apart.
  addTable("en", "");
  for (const auto& [code, key] : {std::pair<int64_t, const char*>{-5800, "RECORDING_ERROR_UNKNOWN"},
                                  {0, "RECORDING_ERROR_UNKNOWN"},
                                  {-5819, "RECORDING_ERROR_UNKNOWN"},
                                  {INT64_MIN, "RECORDING_ERROR_UNKNOWN"},
                                  {INT64_MAX, "RECORDING_ERROR_UNKNOWN"},
                                  {-5801, "RECORDING_ERROR_USER_DECLINED"},
                                  {-5802, "RECORDING_ERROR_DISABLED"},
                                  {-5803, "RECORDING_ERROR_FAILED_TO_START"},
                                  {-5804, "RECORDING_ERROR_FAILED"},
                                  {-5805, "RECORDING_ERROR_INSUFFICIENT_STORAGE"},
                                  {-5806, "RECORDING_ERROR_INTERRUPTED"},
                                  {-5807, "RECORDING_ERROR_CONTENT_RESIZE"},
                                  {-5808, "RECORDING_ERROR_INVALID_BROADCAST_SESSION"},
                                  {-5809, "RECORDING_ERROR_SYSTEM_DORMANCY"},
                                  {-5810, "RECORDING_ERROR_ENTITLEMENTS"},
                                  {-5811, "RECORDING_ERROR_ACTIVE_PHONE_CALL"},
                                  {-5812, "RECORDING_ERROR_FAILED_TO_SAVE"},
                                  {-5813, "RECORDING_ERROR_DASHVEX"},
                                  {-5814, "RECORDING_ERROR_CONNECTION_INVALID"},
                                  {-5815, "RECORDING_ERROR_CONNECTION_INTERRUPTED"},
                                  {-5816, "RECORDING_ERROR_NO_CONTEXTID_MATCH"},
                                  {-5817, "RECORDING_ERROR_MEDIASERVICES_FAILED"},
                                  {-5818, "RECORDING_ERROR_MIXING_FAILURE"}}) {
    const auto error = _qvUserErrorForCode(code);
    EXPECT_EQ(error.domain, "com.tarnwick.Quorvel.QVRecordingErrorDomain");
    EXPECT_EQ(error.code, code);
    EXPECT_EQ(error.userInfo, (Dictionary{{kLocalizedDescriptionKey, Value(key)}}));
  }
}

TEST_F(ErrorsTest, TheTextReplacesTheCallersAndOtherEntriesStay) {
  const Dictionary userInfo{{kLocalizedDescriptionKey, Value("mine")}, {"file", Value("a.mp4")}};
  EXPECT_EQ(_qvUserErrorForCode(errorcode::kFailed, userInfo).userInfo, userInfo);  // no framework, no text
  addTable("en", R"("RECORDING_ERROR_FAILED" = "It failed.";)");
  const auto error = _qvUserErrorForCode(errorcode::kFailed, userInfo);
  EXPECT_EQ(error.localizedDescription(), "It failed.");
  EXPECT_EQ(platform::valueForKey(error.userInfo, "file").asString(), "a.mp4");
}

}  // namespace
}  // namespace qv
