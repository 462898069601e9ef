#pragma once

#include <optional>
#include <string>

#include "platform/base/Error.h"
#include "sdk/client/quorvel/Recorder.h"

namespace qv::client {

/// The application's form of an error that the daemon sent.
quorvel::Error errorFromDaemon(const platform::Error& error);
/// The error of a code that this library itself raises.
quorvel::Error libraryError(quorvel::ErrorCode code, const std::string& detail = {});
/// The error of a call that did not end in its reply: the connection was lost, or the daemon (or the
/// messaging) refused this one call by an error name.
quorvel::Error errorForFailedCall(const platform::Error& error);

}  // namespace qv::client
