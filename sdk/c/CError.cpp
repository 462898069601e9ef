#include "sdk/c/CError.h"

#include <utility>

#include "protocol/RecordingErrors.h"
#include "sdk/client/quorvel/Recorder.h"

// C programs have the codes by names of their own.
#define QV_RECORDING_ERROR(code, name, key) static_assert(QUORVEL_ERROR_##key == (code));
#define QUORVEL_ERROR_NO_CONTEXTID_MATCH QUORVEL_ERROR_NO_CONTEXT_ID_MATCH
#define QUORVEL_ERROR_MEDIASERVICES_FAILED QUORVEL_ERROR_MEDIA_SERVICES_FAILED
#include "protocol/RecordingErrors.def"
#undef QV_RECORDING_ERROR
static_assert(std::string_view(QUORVEL_ERROR_DOMAIN) == quorvel::kErrorDomain);

namespace qv::c {

CError::CError(quorvel::Error error) : kept(std::move(error)) {
  code = kept.code;
  key = kept.key.c_str();
  text = kept.text.c_str();
  domain = kept.domain.c_str();
}

Reference<CError> errorFor(const std::optional<quorvel::Error>& error) {
  return Reference<CError>(error ? new CError(*error) : nullptr);
}

}  // namespace qv::c

using qv::c::CError;

const quorvel_error* quorvel_error_retain(const quorvel_error* error) { return qv::c::retain<CError>(error); }
void quorvel_error_release(const quorvel_error* error) { qv::c::release<CError>(error); }
const char* quorvel_error_key(int64_t code) { return qv::localizationKeyForErrorCode(code); }
