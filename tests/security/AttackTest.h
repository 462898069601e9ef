#pragma once

#include "tests/fakes/LogRecorder.h"
#include "tests/sdbus/RawCall.h"
#include "tests/sdbus/SdBusTest.h"
#include "tests/security/Attacker.h"

namespace qv::security {

using platform::IPCArguments;
using platform::Value;
using platform::test::rawCall;
using platform::test::testInterface;
using namespace std::string_literals;

/// A service, honest clients, and attackers that connect to its path.
class AttackTest : public platform::test::SdBusTest {
 protected:
  explicit AttackTest(platform::SdBusIPCOptions options = {}) : SdBusTest(std::move(options)) {}
  std::string path() const { return directory_ + "/test.service"; }
  /// Everything before this has been read; and somebody else is served.
  void expectService(platform::IPCConnection& honest) {
    EXPECT_EQ(valuesOf(call(honest, "echo", {Value("well")})), IPCArguments{Value("well")});
  }
};

}  // namespace qv::security
