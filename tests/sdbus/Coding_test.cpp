#include <gtest/gtest.h>
#include <sys/socket.h>

#include <set>

#include "platform/base/WireForm.h"
#include "platform/sdbus/BusCoding.h"
#include "platform/sdbus/Handles.h"
#include "platform/sdbus/InterfaceTable.h"
#include "platform/sdbus/Text.h"

namespace qv::platform::sdbus {
namespace {

using Signatures = std::vector<std::string>;

class CodingTest : public testing::Test {
 protected:
  CodingTest() {
    int ends[2];
    sd_bus* bus = nullptr;
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    other_ = FileDescriptor(ends[1]);
    EXPECT_GE(sd_bus_new(&bus), 0);
    bus_.reset(bus);
    EXPECT_GE(sd_bus_set_fd(bus, ends[0], ends[0]), 0);
    EXPECT_GE(sd_bus_start(bus), 0);
  }
  /// Decodes what `append` puts into a message, as one value for each of `signatures`.
  template <typename Append>
  int decode(const Signatures& signatures, const Append& append) {
    sd_bus_message* message = nullptr;
    EXPECT_GE(sd_bus_message_new_method_call(bus_.get(), &message, nullptr, "/x", "a.b", "c"), 0);
    const MessageHandle handle(message);
    EXPECT_GE(append(message), 0);
    EXPECT_GE(sd_bus_message_seal(message, 1, 0), 0);
    return decodeArguments(message, signatures, decoded_);
  }
  FileDescriptor other_;
  BusHandle bus_;
  IPCArguments decoded_;
};

TEST_F(CodingTest, ReadsWhatOnlyForeignPeersSend) {
  const auto foreign = [](sd_bus_message* message) {
    return sd_bus_message_append(message, "ynqog", 200, -5, 65535, "/a/path", "a{sv}");
  };
  EXPECT_EQ(decode({"y", "n", "q", "o", "g"}, foreign), 0);
  EXPECT_EQ(decoded_, (IPCArguments{Value(uint32_t{200}), Value(int32_t{-5}), Value(uint32_t{65535}), Value("/a/path"),
                                    Value("a{sv}")}));
  EXPECT_EQ(decode({"y", "n", "q", "o", "g", "s"}, foreign), -EBADMSG) << "a value too few";
  const auto numbered = [](sd_bus_message* message) { return sd_bus_message_append(message, "a{us}", 1, 7, "x"); };
  EXPECT_EQ(decode({"a{us}"}, numbered), -EINVAL);
}

TEST_F(CodingTest, AMessageThatWouldBecomeTooMuchIsNotRead) {
  const auto items = [&](size_t count) {
    const std::vector<uint32_t> numbers(count);
    return decode({"au"}, [&](auto* message) {
      return sd_bus_message_append_array(message, 'u', numbers.data(), count * sizeof(uint32_t));
    });
  };
  EXPECT_EQ(items(kMaximumDecodedBytes / 64 - 1), 0);
  EXPECT_EQ(items(kMaximumDecodedBytes / 64), -E2BIG);
  std::string text(kMaximumDecodedBytes - 64, 'x');
  const auto bytes = [&](auto* message) { return sd_bus_message_append_array(message, 'y', text.data(), text.size()); };
  const auto string = [&](auto* message) { return sd_bus_message_append(message, "s", text.c_str()); };
  EXPECT_EQ(decode({"ay"}, bytes), 0);
  EXPECT_EQ(decode({"s"}, string), 0);
  text += 'x';
  EXPECT_EQ(decode({"ay"}, bytes), -E2BIG);
  EXPECT_EQ(decode({"s"}, string), -E2BIG);
  const auto nested = [&](int levels) {
    return decode({"v"}, [levels](auto* message) {
      for (int i = 1; i < levels; ++i) EXPECT_GE(sd_bus_message_open_container(message, 'v', "v"), 0);
      int r = sd_bus_message_append(message, "v", "u", 1);
      for (int i = 1; i < levels; ++i) r = sd_bus_message_close_container(message);
      return r;
    });
  };
  EXPECT_EQ(nested(kMaximumFormDepth), 0);
  EXPECT_EQ(nested(kMaximumFormDepth + 1), -ELOOP);
}

TEST_F(CodingTest, CostsCountEachValueAndItsContents) {
  const Value fd(shareFileDescriptor(std::move(other_)));
  const auto cost = costOf({Value("text"), Value(URL("a:b")), Value(Data(5)), Value(Array{fd, Value(1.0), fd}),
                            Value(Dictionary{{"key", Value("value")}})});
  EXPECT_EQ(cost.bytes, 9u * 16 + 4 + 3 + 5 + 3 + 5);
  EXPECT_EQ(cost.descriptors, 2u);
  Value list, dictionary;
  for (int i = 0; i < 2 * kMaximumFormDepth; ++i) {
    list = Value(Array{list});
    dictionary = Value(Dictionary{{"", dictionary}});
  }
  constexpr size_t kLooked = (kMaximumFormDepth + 2) * 16;  // deeper ones cannot be sent
  EXPECT_EQ(costOf({list}).bytes, kLooked);
  EXPECT_EQ(costOf({dictionary}).bytes, kLooked);
}

TEST(TextTest, EachByteThatIsNoUTF8IsReplaced) {
  using namespace std::string_literals;
  for (const std::string& valid :
       {"\x01\x7F"s, "\xC2\x80\xDF\xBF"s, "\xE0\xA0\x80\xE1\x80\x80\xED\x80\x80\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBF"s,
        "\xF0\x90\x80\x80\xF1\x80\x80\x80\xF4\x80\x80\x80\xF4\x8F\xBF\xBF"s}) {
    EXPECT_EQ(validText(valid), valid);
  }
  for (const std::string& invalid :
       {"\0"s, "\x80"s, "\xBF"s, "\xC0\x80"s, "\xC1\xBF"s, "\xC2"s, "\xE0\x9F\xBF"s, "\xE1\x80"s, "\xED\xA0\x80"s,
        "\xF0\x8F\xBF\xBF"s, "\xF1\x80\x80"s, "\xF4\x90\x80\x80"s, "\xF5\x80\x80\x80"s, "\xFF"s}) {
    std::string replaced;
    for (size_t i = 0; i < invalid.size(); ++i) replaced += "\xEF\xBF\xBD";
    EXPECT_EQ(validText(invalid), replaced);
    EXPECT_EQ(validText("a" + invalid + "z"), "a" + replaced + "z");
  }
}

TEST(InterfaceTableTest, ConnectionsShareTheTableOfTheSameInterfaceOnly) {
  using Operations = std::vector<IPCOperation>;
  const Signatures none, u{"u"};
  const IPCInterface different[] = {{"a.b", Operations{{"op", {"s", "u"}, {"x"}, u, {"y"}}}},
                                    {"a.c", Operations{{"op", {"s", "u"}, {"x"}, u, {"y"}}}},
                                    {"a.b", Operations{{"o", {"s", "u"}, {"x"}, u, {"y"}}}},
                                    {"a.b", Operations{{"op", {"su"}, {"x"}, u, {"y"}}}},
                                    {"a.b", Operations{{"op", {"s", "u"}, {"z"}, u, {"y"}}}},
                                    {"a.b", Operations{{"op", {"s", "u"}, {"x"}, u, {"z"}}}},
                                    {"a.b", Operations{{"op", {"s", "u"}, {"x"}, none, {}}}},
                                    {"a.b", Operations{{"op", {"s", "u"}, {"x"}, {}, {}}}},
                                    {"a.b", Operations{{"op", {"s", "u"}, {"x"}, {}, {}, true}}}};
  std::set<std::shared_ptr<const InterfaceTable>> tables;
  for (const IPCInterface& each : different) tables.insert(InterfaceTable::shared(each));
  EXPECT_EQ(tables.size(), std::size(different));
  for (const IPCInterface& each : different) EXPECT_TRUE(tables.contains(InterfaceTable::shared(each)));
}

}  // namespace
}  // namespace qv::platform::sdbus
