#include "platform/sdbus/WireGate.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <algorithm>

#include "platform/sdbus/WireHeader.h"
#include "tests/sdbus/RawCall.h"

namespace qv::platform::test {
namespace {

using namespace std::string_literals;
using sdbus::WireGate;
using Descriptors = std::vector<FileDescriptor>;

constexpr uid_t kPeer = 1000;
constexpr uid_t kOwn = 7;
const std::string kHello = "\0AUTH EXTERNAL 31303030\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s;

Descriptors descriptors(size_t count) {
  Descriptors made;
  while (made.size() < count) made.emplace_back(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  return made;
}

/// Gives a gate bytes, at most `most` at a time and never more than it has room for.
void give(WireGate& gate, std::string_view bytes, size_t most, Descriptors with, std::vector<sdbus::WireUnit>& passed) {
  while (!bytes.empty() && !gate.fault()) {
    const auto room = gate.room();
    ASSERT_FALSE(room.empty());
    const size_t size = std::min({room.size(), bytes.size(), most});
    std::copy_n(bytes.begin(), size, room.begin());
    gate.filled(size, std::exchange(with, {}));
    bytes.remove_prefix(size);
    if (gate.hasUnit()) passed.push_back(gate.takeUnit());
  }
}

std::string textOf(const std::vector<sdbus::WireUnit>& units) {
  std::string text;
  for (const auto& unit : units) text.append(unit.bytes.begin(), unit.bytes.end());
  return text;
}

/// What a gate in front of a server passes of what a client sends.
struct Passage {
  explicit Passage(std::string_view bytes, size_t most = 1000) { give(gate, bytes, most, {}, units); }
  void message(std::string_view bytes, size_t most, Descriptors with) {
    units.clear();
    give(gate, bytes, most, std::move(with), units);
  }
  WireGate gate{sdbus::authenticationOfClient(kPeer, kOwn)};
  std::vector<sdbus::WireUnit> units;
};

TEST(WireGateTest, AuthenticationPassesAsOurOwnAndEndsWithItsLastByte) {
  const struct {
    std::string said, passed;
    bool isAuthenticated;
  } dialogues[] = {
      {kHello, "\0AUTH EXTERNAL 37\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s, true},
      {"\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s,
       "\0AUTH EXTERNAL\r\nDATA 37\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s, true},
      {"\0AUTH\r\nAUTH EXTERNAL 31303030\r\nBEGIN\r\n"s, "\0AUTH\r\nAUTH EXTERNAL 37\r\nBEGIN\r\n"s, true},
      {"\0AUTH ANONYMOUS 78\r\nHOW ARE YOU\r\n"s, "\0AUTH\r\nUNKNOWN\r\n"s, false},
      {"\0AUTH EXTERNAL 30\r\n"s, "\0AUTH\r\n"s, false},  // somebody else's number
      {"\0AUTH EXTERNAL\r\nDATA 30\r\n"s, "\0AUTH EXTERNAL\r\nCANCEL\r\n"s, false},
      {"\0NEGOTIATE_UNIX_FD\r\n"s, "\0UNKNOWN\r\n"s, false},
  };
  for (const auto& dialogue : dialogues) {
    for (const size_t most : {1000u, 1u}) {
      // A message that follows at once is not taken for a part of it.
      Passage passage(dialogue.said, most);
      EXPECT_EQ(textOf(passage.units), dialogue.passed);
      EXPECT_EQ(passage.gate.isAuthenticated(), dialogue.isAuthenticated) << dialogue.said;
      EXPECT_EQ(passage.gate.fault(), nullptr);
    }
  }
}

TEST(WireGateTest, AnAuthenticationThatDoesNotHoldIsAFault) {
  const std::string kAttacks[] = {
      "GET / HTTP/1.1\r\n",
      "\0BEGIN\r\n"s,
      "\0AUTH EXTERNAL\r\nBEGIN\r\n"s,
      "\0AUTH EXTERNAL 30\r\nBEGIN\r\n"s,
      "\0AUTH EXTERNAL 31303030\r\nCANCEL\r\nBEGIN\r\n"s,
      "\0DATA 31303030\r\n"s,
      "\0"s + std::string(600, 'A'),
      [] {
        std::string endless(1, '\0');
        for (int i = 0; i < 2000; ++i) endless += "AUTH\r\n";
        return endless;
      }(),
  };
  for (const std::string& attack : kAttacks) EXPECT_NE(Passage(attack).gate.fault(), nullptr) << attack;
}

TEST(WireGateTest, AServersLinesPassWhereSdBusWaitsForThem) {
  const std::string ok = "DATA\r\nOK 0123456789abcdef0123456789ABCDEF\r\n";
  const struct {
    std::string said;
    bool isAuthenticated, mayHaveDescriptors;
  } dialogues[] = {{ok + "AGREE_UNIX_FD\r\n", true, true},
                   {ok + "ERROR \"no\"\r\n", true, false},
                   {ok + "BEGIN\r\n", false, false},
                   {"REJECTED EXTERNAL\r\n", false, false},
                   {"DATA\r\nOK 0123\r\nAGREE_UNIX_FD\r\n", false, false}};
  for (const auto& dialogue : dialogues) {
    WireGate gate(sdbus::authenticationOfServer());
    std::vector<sdbus::WireUnit> units;
    give(gate, dialogue.said, 1000, {}, units);
    EXPECT_EQ(gate.isAuthenticated(), dialogue.isAuthenticated) << dialogue.said;
    EXPECT_EQ(gate.fault() == nullptr, dialogue.isAuthenticated) << dialogue.said;
    if (!dialogue.isAuthenticated) continue;
    give(gate, rawCall("a.b", "c", "", "", 0, "/x", 1), 1000, descriptors(1), units);
    EXPECT_EQ(gate.fault() == nullptr, dialogue.mayHaveDescriptors);
  }
}

TEST(WireGateTest, MessagesPassWholeAndWithTheirDescriptors) {
  const std::string plain = rawCall("a.b", "notify", "u", "\1\0\0\0"s);
  const std::string frame = rawCall("a.b", "frame", "(hh)ay", std::string(12, '\0'), 0, "/x", 4);
  for (const size_t most : {1u, 7u, 100000u}) {
    Passage passage(kHello);
    passage.message(plain + frame.substr(0, 3), most, {});
    ASSERT_EQ(passage.units.size(), 1u);
    EXPECT_EQ(textOf(passage.units), plain);
    EXPECT_TRUE(passage.units[0].isMessage);
    EXPECT_EQ(passage.gate.heldBytes(), 3u);
    passage.message(frame.substr(3), most, descriptors(4));
    ASSERT_EQ(passage.units.size(), 1u);
    EXPECT_EQ(textOf(passage.units), frame);
    EXPECT_EQ(passage.units[0].descriptors.size(), 4u);
    EXPECT_EQ(passage.gate.heldBytes(), 0u);
  }
}

std::string swapped(std::string message) {
  for (const size_t number : {4u, 8u, 12u, 20u}) std::reverse(&message[number], &message[number + 4]);
  message[0] = 'B';
  return message;
}

/// A header with just a path and a member; 16: path, 32: member.
std::string smallCall() {
  std::string call = rawCall("", "", "", "").substr(0, 12) + "\x1a\0\0\0"s;
  call += "\1\1o\0\2\0\0\0/x\0\0\0\0\0\0"s + "\3\1s\0\1\0\0\0m\0"s;
  return call + std::string(6, '\0');
}

TEST(WireGateTest, EitherByteOrderIsRead) {
  std::string big = smallCall();
  big = swapped(big);
  std::reverse(&big[36], &big[40]);
  for (const std::string& call : {smallCall(), big}) {
    Passage passage(kHello);
    passage.message(call, 1000, {});
    EXPECT_EQ(passage.gate.fault(), nullptr) << passage.gate.fault();
    EXPECT_EQ(textOf(passage.units), call);
  }
}

std::string with(std::string message, size_t at, std::string_view bytes) {
  return message.replace(at, bytes.size(), bytes);
}

TEST(WireGateTest, ADamagedHeaderIsAFaultAndItsDescriptorsAreClosed) {
  const std::string call = smallCall();
  const auto named = [](const std::string& interface, const std::string& member, const std::string& path) {
    return rawCall(interface, member, "", "", 0, path);
  };
  const std::string kDamaged[] = {
      with(call, 0, "x"),                                // byte order
      with(call, 1, "\0"s),                              // type: none
      with(call, 1, "\5"),                               // of nobody
      with(call, 1, "\2"),                               // an answer to nothing
      with(call, 1, "\3"),                               // an error without name
      with(call, 1, "\4"),                               // a signal without interface
      with(call, 3, "\2"),                               // version
      with(call, 8, "\0\0\0\0"s),                        // serial
      with(call, 12, "\x19"),                            // fields that end in the middle of one
      with(call, 12, "\x1b"),                            // or behind
      with(call, 16, "\0"s),                             // a field of no code
      with(call, 16, "\x0a"),                            // an unknown one
      with(call, 32, "\1"),                              // one that is there already
      with(call, 17, "\2"),                              // a longer signature of a field
      with(call, 18, "s"),                               // another type than the field's
      with(call, 20, "\xFF\xFF\xFF\xFF"),                // a text longer than the message
      with(call, 24, "x"),                               // no path
      with(call, 25, "\0"s),                             // a text with an end within
      with(call, 27, "x"),                               // padding between fields
      with(call, call.size() - 1, "x"),                  // padding after them
      with(call, 4, "\4") + "body",                      // which has no signature
      named("nodots", "m", "/x"),                        //
      named("a.b", "m-m", "/x"),                         //
      named("a.b", std::string(256, 'm'), "/x"),         //
      named("a.b", "m", "/x//y"),                        //
      named("a.b", "m", "/org/freedesktop/DBus/Local"),  //
      named("org.freedesktop.DBus.Local", "m", "/x"),    //
      rawCall("a.b", "m", "a", ""),                      //
      rawCall("a.b", "m", "", "", 0, "/x", 3),           // tells of three descriptors
  };
  for (const std::string& damaged : kDamaged) {
    Passage passage(kHello);
    Descriptors sent = descriptors(2);
    const int numbers[] = {sent[0].get(), sent[1].get()};
    passage.message(damaged, 1000, std::move(sent));
    EXPECT_TRUE(passage.units.empty());
    for (const int number : numbers) EXPECT_EQ(::fcntl(number, F_GETFD), -1);
    // It is not (only) the descriptors.
    Passage plain(kHello);
    plain.message(damaged, 1000, {});
    EXPECT_NE(plain.gate.fault(), nullptr) << testing::PrintToString(damaged);
  }
}

TEST(WireGateTest, TooMuchIsAFaultBeforeItIsThere) {
  Passage five(kHello);
  five.message("l", 1, descriptors(3));
  EXPECT_EQ(five.gate.fault(), nullptr);
  five.message("\1", 1, descriptors(2));
  EXPECT_NE(five.gate.fault(), nullptr);
  Passage unasked("\0AUTH EXTERNAL 31303030\r\nBEGIN\r\n"s);
  unasked.message("l", 1, descriptors(1));
  EXPECT_NE(unasked.gate.fault(), nullptr);
  const std::string beginning = smallCall().substr(0, sdbus::kWireHeaderBytes);
  for (const auto& [bytes, isTooLarge] : {std::pair("\x00\x00\x20\x00"s, true), {"\xC0\xFF\x1F\x00"s, false}}) {
    Passage large(kHello);
    large.message(with(beginning, 4, bytes), 1000, {});
    EXPECT_EQ(large.gate.fault() != nullptr, isTooLarge);
    // Memory is not taken for what is only announced.
    if (!isTooLarge) {
      EXPECT_LE(large.gate.room().size(), 64u << 10);
    }
  }
}

TEST(WireGateTest, SignaturesAreCompleteTypes) {
  const auto isValid = [](const std::string& text) {
    return sdbus::isWireSignature({reinterpret_cast<const uint8_t*>(text.data()), text.size()});
  };
  const std::string deepest = std::string(32, 'a') + "y";
  for (const std::string& valid : {""s, "ybnqiuxtdsoghv"s, "a{sv}aa{s(hh)}(dd)av"s, "((y)y)"s, deepest}) {
    EXPECT_TRUE(isValid(valid)) << valid;
  }
  for (const std::string& invalid :
       {"a"s, "()"s, "(y"s, "y)"s, "a{vs}"s, "a{s}"s, "a{sss}"s, "{sv}"s, "a{sv"s, "z"s, "y\0y"s, "a" + deepest,
        std::string(33, '(') + "y" + std::string(33, ')'), std::string(256, 'y')}) {
    EXPECT_FALSE(isValid(invalid)) << invalid;
  }
}

}  // namespace
}  // namespace qv::platform::test
