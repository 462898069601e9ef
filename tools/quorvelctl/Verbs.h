#pragma once

#include "tools/quorvelctl/Arguments.h"
#include "tools/quorvelctl/Failure.h"
#include "tools/quorvelctl/Output.h"
#include "tools/quorvelctl/Signals.h"

namespace ctl {

/// What a verb works with.
///
/// Threading: one thread.
struct Stage {
  const Arguments& arguments;
  Output& output;
  const Signals& signals;
};

// Each ends with how the program is to end, or throws a Failure.
Exit showStatus(const Stage& stage);
Exit watch(const Stage& stage);
Exit record(const Stage& stage);
Exit stop(const Stage& stage);
Exit save(const Stage& stage);
Exit listMovies(const Stage& stage);
Exit listExtensions(const Stage& stage);
Exit showMetrics(const Stage& stage);
Exit recover(const Stage& stage);
Exit doctor(const Stage& stage);

}  // namespace ctl
