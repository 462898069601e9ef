#pragma once

#include <optional>

#include "sdk/c/Counted.h"
#include "sdk/c/quorvel/quorvel.h"
#include "sdk/common/quorvel/Types.h"

namespace qv::c {

/// An error with the texts that its public part names.
///
/// Threading: as Counted.
struct CError final : Counted<quorvel_error> {
  explicit CError(quorvel::Error error);
  const quorvel::Error kept;
};

/// Nothing where there is no error; a C handler is called with `get()`.
Reference<CError> errorFor(const std::optional<quorvel::Error>& error);

}  // namespace qv::c
