#pragma once

#include "platform/base/Value.h"
#include "sdk/common/quorvel/Types.h"

namespace qv::sdk {

// Between the values that cross a connection and those of the libraries' users.

platform::Value toWire(const quorvel::Value& value);
platform::Dictionary toWire(const quorvel::Dictionary& dictionary);
/// Descriptors have no form for users and are left out; dates become seconds since 1970.
quorvel::Value fromWire(const platform::Value& value);
quorvel::Dictionary fromWire(const platform::Dictionary& dictionary);

/// The keyed archive that a configuration crosses in.
platform::Data archive(const quorvel::BroadcastConfiguration& configuration);

}  // namespace qv::sdk
