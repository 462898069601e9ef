#include "support/MovieBook.h"

#include <filesystem>
#include <utility>

namespace qv {
namespace {

/// "Chess.mp4" itself, "Chess 2.mp4", ...
std::string numbered(const std::string& path, int number) {
  if (number == 1) return path;
  const std::filesystem::path whole(path);
  const std::string name = whole.stem().string() + " " + std::to_string(number) + whole.extension().string();
  return (whole.parent_path() / name).string();
}

template <typename Test>
std::string firstNumbered(const std::string& path, const Test& suits) {
  for (int number = 1;; ++number) {
    std::string candidate = numbered(path, number);
    if (suits(candidate)) return candidate;
  }
}

}  // namespace

std::optional<std::string> MovieBook::takeForRecording(const std::string& path, const std::string& owner, OwnMovie own,
                                                       Continuation whenSettled) {
  std::lock_guard lock(mutex_);
  std::string at = firstNumbered(path, [&](const std::string& candidate) {
    const Movie* movie = find(candidate);
    if (!movie) return true;
    if (movie->hands == Hands::Made || (movie->hands == Hands::Handed && own == OwnMovie::Keep)) return false;
    return movie->owner == owner || movie->owner.empty();
  });
  Movie& movie = movies_[at];
  if (movie.hands == Hands::Saved || movie.hands == Hands::Stored || movie.hands == Hands::Removed) {
    movie.waiting.push_back(std::move(whenSettled));
    return std::nullopt;
  }
  movie = {Hands::Made, owner, {}};
  return at;
}

std::string MovieBook::takeForCopy(const std::string& path, const std::string& owner) {
  return take(path, owner, [&](const std::string&, const Movie* movie) { return !movie || isHandedTo(movie, owner); });
}

std::string MovieBook::takeUnused(const std::string& path) {
  platform::FileSystem& disk = files_.disk();
  return take(path, {},
              [&](const std::string& candidate, const Movie* movie) { return !movie && !disk.itemExists(candidate); });
}

std::string MovieBook::take(const std::string& path, const std::string& owner,
                            const std::function<bool(const std::string&, const Movie*)>& mayTake) {
  std::lock_guard lock(mutex_);
  std::string at =
      firstNumbered(path, [&](const std::string& candidate) { return mayTake(candidate, find(candidate)); });
  movies_.insert_or_assign(at, Movie{Hands::Made, owner, {}});
  return at;
}

void MovieBook::hand(const std::string& path, const std::string& owner) {
  std::lock_guard lock(mutex_);
  movies_.insert_or_assign(path, Movie{Hands::Handed, owner, {}});
  lastHanded_[owner] = path;
}

bool MovieBook::isHanded(const std::string& path, const std::string& owner) const {
  std::lock_guard lock(mutex_);
  return isHandedTo(find(path), owner);
}

std::map<std::string, MovieStanding> MovieBook::standings() const {
  std::lock_guard lock(mutex_);
  std::map<std::string, MovieStanding> all;
  for (const auto& [path, movie] : movies_) {
    const auto hands = movie.hands == Hands::Made      ? MovieStanding::Hands::Recorded
                       : movie.hands == Hands::Handed  ? MovieStanding::Hands::Handed
                       : movie.hands == Hands::Removed ? MovieStanding::Hands::Removed
                                                       : MovieStanding::Hands::Saved;
    all.emplace(path, MovieStanding{hands, movie.owner});
  }
  return all;
}

std::optional<platform::Result<platform::FileDescriptor>> MovieBook::openHanded(const std::string& path,
                                                                                const std::string& owner) const {
  std::lock_guard lock(mutex_);
  if (!isHandedTo(find(path), owner)) return std::nullopt;
  return files_.disk().openFile(path);
}

bool MovieBook::beginSave(const std::string& path, const std::string& owner) {
  std::lock_guard lock(mutex_);
  if (!isHandedTo(find(path), owner)) return false;
  movies_[path].hands = Hands::Saved;
  return true;
}

void MovieBook::beginStoring(const std::string& path, const std::string& owner) {
  std::lock_guard lock(mutex_);
  movies_.insert_or_assign(path, Movie{Hands::Stored, owner, {}});
}

MovieBook::Discard MovieBook::beginDiscard(const std::string& owner, Continuation whenSettled) {
  std::lock_guard lock(mutex_);
  const auto last = lastHanded_.find(owner);
  const auto movie = last == lastHanded_.end() ? movies_.end() : movies_.find(last->second);
  if (movie == movies_.end() || movie->second.owner != owner) return {};
  if (movie->second.hands == Hands::Saved) {
    movie->second.waiting.push_back(std::move(whenSettled));
    return {std::nullopt, true};
  }
  if (movie->second.hands != Hands::Handed) return {};
  movie->second.hands = Hands::Removed;
  return {movie->first};
}

void MovieBook::beginRemoval(const std::string& path) {
  std::lock_guard lock(mutex_);
  movies_[path].hands = Hands::Removed;
}

bool MovieBook::beginPurge(const std::string& path) {
  std::lock_guard lock(mutex_);
  const Movie* movie = find(path);
  if (movie && movie->hands != Hands::Handed) return false;
  movies_[path].hands = Hands::Removed;
  return true;
}

void MovieBook::release(const std::string& path) {
  std::vector<Continuation> waiting;
  {
    std::lock_guard lock(mutex_);
    waiting = std::move(movies_[path].waiting);
    movies_.erase(path);
  }
  for (const Continuation& goOn : waiting) goOn();
}

void MovieBook::giveBack(const std::string& path) {
  std::vector<Continuation> waiting;
  {
    std::lock_guard lock(mutex_);
    Movie& movie = movies_[path];
    waiting = std::exchange(movie.waiting, {});
    if (movie.hands == Hands::Stored) lastHanded_[movie.owner] = path;
    movie.hands = Hands::Handed;
    if (movie.owner.empty()) movies_.erase(path);
  }
  for (const Continuation& goOn : waiting) goOn();
}

void MovieBook::dropWaiting() {
  std::vector<std::vector<Continuation>> dropped;
  std::lock_guard lock(mutex_);
  for (auto& [path, movie] : movies_) dropped.push_back(std::exchange(movie.waiting, {}));
}

const MovieBook::Movie* MovieBook::find(const std::string& path) const {
  const auto found = movies_.find(path);
  return found == movies_.end() ? nullptr : &found->second;
}

bool MovieBook::isHandedTo(const Movie* movie, const std::string& owner) {
  return movie && movie->hands == Hands::Handed && movie->owner == owner;
}

}  // namespace qv
