#include <utility>

#include "sdk/c/CError.h"
#include "sdk/c/CRecorder.h"
#include "sdk/c/CValue.h"
#include "sdk/client/quorvel/Status.h"

using namespace qv::c;

/// The C program's status reader.
///
/// Threading: thread-safe, as the reader is.
struct quorvel_status_reader {
  std::unique_ptr<quorvel::StatusReader> reader;
};

namespace {

quorvel::StatusReader::Handler listHandler(quorvel_value_handler handler, void* context) {
  return [=](quorvel::StatusResult result) {
    if (!handler) return;
    quorvel::Value::Array entries;
    for (auto& entry : result.entries) entries.emplace_back().content = std::move(entry);
    const auto list = result.error ? nullptr : valueFor(quorvel::Value{std::move(entries)});
    handler(context, errorFor(result.error).get(), list.get());
  };
}

}  // namespace

quorvel_status_reader* quorvel_status_reader_create(void) {
  return new quorvel_status_reader{quorvel::StatusReader::create()};
}

void quorvel_status_reader_destroy(quorvel_status_reader* reader) { delete reader; }

void quorvel_status_reader_recordings(quorvel_status_reader* reader, quorvel_value_handler handler, void* context) {
  reader->reader->recordings(listHandler(handler, context));
}

void quorvel_status_reader_start_conditions(quorvel_status_reader* reader, const char* bundle_id, bool system,
                                            bool microphone, quorvel_value_handler handler, void* context) {
  reader->reader->startConditions(text(bundle_id), system, microphone, listHandler(handler, context));
}

void quorvel_status_reader_movies(quorvel_status_reader* reader, quorvel_value_handler handler, void* context) {
  reader->reader->movies(listHandler(handler, context));
}

void quorvel_status_reader_device(quorvel_status_reader* reader, quorvel_value_handler handler, void* context) {
  reader->reader->device(listHandler(handler, context));
}
