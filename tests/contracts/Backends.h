#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <vector>

#include "tests/kit/Process.h"

namespace qv::contracts {

/// A backend of one contract, and what the machine must have for it.
template <typename Stage>
struct Backend {
  const char* name;
  std::unique_ptr<Stage> (*make)();  ///< sets the stage for a case
  std::vector<const char*> programs = {};
};
template <typename Stage>
std::ostream& operator<<(std::ostream& out, const Backend<Stage>& backend) {
  return out << backend.name;
}
template <typename Stage, typename BackendsStage>
std::unique_ptr<Stage> make() {
  return std::make_unique<BackendsStage>();
}
inline constexpr auto kNameOfBackend = [](const auto& backend) { return backend.param.name; };

/// One contract, asked of the backends for which it is instantiated.
///
/// Threading: one thread.
template <typename Stage>
class ContractTest : public testing::TestWithParam<Backend<Stage>> {
 protected:
  void SetUp() override {
    for (const char* program : this->GetParam().programs)
      if (!kit::isInstalled(program)) GTEST_SKIP() << program << " is not installed";
    stage_ = this->GetParam().make();
  }
  std::unique_ptr<Stage> stage_;
};

}  // namespace qv::contracts
