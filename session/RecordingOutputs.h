#pragma once

#include <memory>

#include "session/ClientOutput.h"
#include "session/RecordingOutput.h"
#include "session/RecordingSettings.h"

namespace qv {

/// The output of a recording with these settings: an extension where it is a broadcast, else the client where it is a
/// capture, else a movie.
[[nodiscard]] std::shared_ptr<RecordingOutput> makeRecordingOutput(const std::shared_ptr<RecordingContext>& context,
                                                                   const RecordingSettings& settings,
                                                                   OutputEvents events, ClientOutput::Client client);

}  // namespace qv
