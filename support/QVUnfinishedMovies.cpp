#include "support/QVUnfinishedMovies.h"

#include <algorithm>
#include <cerrno>
#include <string>
#include <string_view>

#include "platform/threads/Log.h"

namespace qv {
namespace {

using platform::Error;
using platform::MovieState;
using platform::Result;
namespace logs = platform::logs;

constexpr std::string_view kExtension = ".mp4";
constexpr std::string_view kRecovered = "_recovered_";
/// Names may be taken where the clock starts anew at each boot.
constexpr int kMaximumNames = 100;

}  // namespace

/// "Chess.mp4" as "Chess_recovered_02-29-2024 19-35-12"; nothing where the file's time cannot be read.
Result<std::string> QVUnfinishedMovies::recoveredStem(const std::string& name) {
  const auto attributes = files_.disk().attributesOfItem(files_.pathInStore(name));
  if (!attributes) return attributes.error();
  std::string date = localization_.formatDate(attributes.value().modificationDate, "MM-dd-yyyy HH:mm:ss");
  std::replace(date.begin(), date.end(), ':', '-');
  return name.substr(0, name.size() - kExtension.size()) + std::string(kRecovered) + date;
}

/// Gives the movie the name under which it is kept. One that could not be finished at an earlier start has it.
Result<std::string> QVUnfinishedMovies::keepAside(const std::string& name) {
  if (name.find(kRecovered) != std::string::npos) return name;
  const auto stem = recoveredStem(name);
  if (!stem) return stem.error();
  for (int number = 1; number <= kMaximumNames; ++number) {
    const std::string suffix = number == 1 ? std::string() : " " + std::to_string(number);
    const std::string kept = stem.value() + suffix + std::string(kExtension);
    const auto error = files_.disk().moveItem(files_.pathInStore(name), files_.pathInStore(kept));
    if (!error) return kept;
    if (error->code != EEXIST) return *error;
  }
  return Error::posix(EEXIST, stem.value());
}

void QVUnfinishedMovies::removeWithoutMedia(const std::string& name) {
  QV_LOG(logs::kSupport, "removing the unfinished movie \"%s\", into which no picture was written", name.c_str());
  if (const auto error = files_.disk().removeItem(files_.pathInStore(name))) {
    QV_LOG_ERROR(logs::kSupport, "unfinished movie: %s", error->description().c_str());
  }
}

void QVUnfinishedMovies::finishMovie(const std::string& name) {
  const auto kept = keepAside(name);
  if (!kept) {
    QV_LOG_ERROR(logs::kSupport, "unfinished movie: %s", kept.error().description().c_str());
    return;
  }
  const auto length = salvage_.salvageMovie(files_.pathInStore(kept.value()));
  if (!length) {
    QV_LOG_ERROR(logs::kSupport, "the unfinished movie \"%s\" stays as it is: %s", kept.value().c_str(),
                 length.error().description().c_str());
  } else if (length.value() == platform::MediaTime::zero()) {
    removeWithoutMedia(kept.value());
  } else {
    QV_LOG(logs::kSupport, "finished an unfinished movie of %.1f s: \"%s\"", length.value().seconds(),
           kept.value().c_str());
  }
}

/// A movie that is damaged so that nobody here can read it. Somebody else may.
void QVUnfinishedMovies::keepDamaged(const std::string& name, const Error& damage) {
  const auto kept = keepAside(name);
  const Error& reason = kept ? damage : kept.error();
  QV_LOG_ERROR(logs::kSupport, "\"%s\" is no movie that can be finished, and stays as it is, as \"%s\": %s",
               name.c_str(), kept ? kept.value().c_str() : name.c_str(), reason.description().c_str());
}

void QVUnfinishedMovies::_srSalvageUnfinishedMovies() {
  const auto names = files_.disk().contentsOfDirectory(files_._srTempPath());
  if (!names) {
    QV_LOG_ERROR(logs::kSupport, "unfinished movies: %s", names.error().description().c_str());
    return;
  }
  for (const std::string& name : names.value()) {
    if (!name.ends_with(kExtension)) continue;
    const auto state = salvage_.stateOfMovie(files_.pathInStore(name));
    if (!state && state.error().domain != platform::kPosixErrorDomain) {
      keepDamaged(name, state.error());
    } else if (!state) {
      QV_LOG_ERROR(logs::kSupport, "\"%s\" cannot be looked at: %s", name.c_str(), state.error().description().c_str());
    } else if (state.value() == MovieState::Unfinished) {
      finishMovie(name);
    }
  }
}

}  // namespace qv
