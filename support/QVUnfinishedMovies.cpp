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

using Fate = StoredMovie::Fate;

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

StoredMovie QVUnfinishedMovies::removeWithoutMedia(const std::string& name) {
  QV_LOG(logs::kSupport, "removing the unfinished movie \"%s\", into which no picture was written", name.c_str());
  if (const auto error = files_.disk().removeItem(files_.pathInStore(name))) {
    QV_LOG_ERROR(logs::kSupport, "unfinished movie: %s", error->description().c_str());
    return {name, Fate::Unreadable, std::nullopt, error};
  }
  return {name, Fate::Removed};
}

StoredMovie QVUnfinishedMovies::finishMovie(const std::string& name) {
  const auto kept = keepAside(name);
  if (!kept) {
    QV_LOG_ERROR(logs::kSupport, "unfinished movie: %s", kept.error().description().c_str());
    return {name, Fate::Unreadable, std::nullopt, kept.error()};
  }
  const auto length = salvage_.salvageMovie(files_.pathInStore(kept.value()));
  if (!length) {
    QV_LOG_ERROR(logs::kSupport, "the unfinished movie \"%s\" stays as it is: %s", kept.value().c_str(),
                 length.error().description().c_str());
    return {kept.value(), Fate::Unfinished, std::nullopt, length.error()};
  }
  if (length.value() == platform::MediaTime::zero()) return removeWithoutMedia(kept.value());
  // Somebody else was faster.
  if (!length.value().isValid()) return {kept.value(), Fate::Recovered};
  QV_LOG(logs::kSupport, "finished an unfinished movie of %.1f s: \"%s\"", length.value().seconds(),
         kept.value().c_str());
  return {kept.value(), Fate::Mended, length.value().seconds()};
}

/// A movie that is damaged so that nobody here can read it. Somebody else may.
StoredMovie QVUnfinishedMovies::keepDamaged(const std::string& name, const Error& damage) {
  const auto kept = keepAside(name);
  const Error& reason = kept ? damage : kept.error();
  QV_LOG_ERROR(logs::kSupport, "\"%s\" is no movie that can be finished, and stays as it is, as \"%s\": %s",
               name.c_str(), kept ? kept.value().c_str() : name.c_str(), reason.description().c_str());
  return {kept ? kept.value() : name, Fate::Damaged, std::nullopt, reason};
}

StoredMovie QVUnfinishedMovies::movieNamed(const std::string& name) {
  const auto state = salvage_.stateOfMovie(files_.pathInStore(name));
  if (!state) {
    const bool isOfFile = state.error().domain == platform::kPosixErrorDomain;
    return {name, isOfFile ? Fate::Unreadable : Fate::Damaged, std::nullopt, state.error()};
  }
  if (state.value() == MovieState::Unfinished) return {name, Fate::Unfinished};
  if (state.value() == MovieState::InUse) return {name, Fate::InUse};
  return {name, name.find(kRecovered) != std::string::npos ? Fate::Recovered : Fate::Finished};
}

StoredMovie QVUnfinishedMovies::salvaged(const StoredMovie& movie) {
  if (movie.fate == Fate::Unfinished) return finishMovie(movie.name);
  if (movie.fate == Fate::Damaged) return keepDamaged(movie.name, *movie.error);
  if (movie.fate == Fate::Unreadable) {
    QV_LOG_ERROR(logs::kSupport, "\"%s\" cannot be looked at: %s", movie.name.c_str(),
                 movie.error->description().c_str());
  }
  return movie;
}

Result<std::vector<StoredMovie>> QVUnfinishedMovies::movies() {
  auto names = files_.disk().contentsOfDirectory(files_._srTempPath());
  if (!names) return names.error();
  std::ranges::sort(*names);
  std::vector<StoredMovie> all;
  for (const std::string& name : *names) {
    if (name.ends_with(kExtension)) all.push_back(movieNamed(name));
  }
  return all;
}

Result<std::vector<StoredMovie>> QVUnfinishedMovies::_srSalvageUnfinishedMovies() {
  auto all = movies();
  if (!all) {
    QV_LOG_ERROR(logs::kSupport, "unfinished movies: %s", all.error().description().c_str());
    return all;
  }
  for (StoredMovie& movie : *all) movie = salvaged(movie);
  return all;
}

}  // namespace qv
