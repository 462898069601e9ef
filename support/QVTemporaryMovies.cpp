#include "support/QVTemporaryMovies.h"

#include <cerrno>
#include <filesystem>
#include <utility>

#include "platform/threads/Guarded.h"
#include "support/MovieBook.h"
#include "support/QuorvelErrors.h"

namespace qv {
namespace {

using platform::Error;
using platform::URL;
using Book = std::shared_ptr<MovieBook>;

std::string normalized(const std::string& path) { return std::filesystem::path(path).lexically_normal().string(); }

/// The path is its remover's until the file is gone, and nobody's also where that fails: then it ages out.
void removeAndRelease(const Book& book, const std::string& path, FileCompletion completion) {
  book->files()._srRemoveFile(URL::fileURL(path), [book, path, completion = std::move(completion)](const auto& error) {
    book->release(path);
    if (completion) completion(error);
  });
}

/// What could not be removed stays its application's.
void endPurge(MovieBook& book, const std::string& path) {
  if (book.files().isMovieAt(path)) {
    book.giveBack(path);
  } else {
    book.release(path);
  }
}

/// The book, for as long as one has a right that is written there. The right is used up by taking it.
class Right {
 public:
  Right(Book book, std::string path) : path_(std::move(path)), files_(book->files()), book_(std::move(book)) {}
  [[nodiscard]] bool hasFile() const { return files_.isMovieAt(path_); }
  [[nodiscard]] const std::string& path() const { return path_; }
  /// Nothing from the second time on.
  [[nodiscard]] Book use() { return book_.exchange(nullptr); }
  void useForRemoval(FileCompletion completion) {
    const Book book = use();
    if (!book) {
      files_.answerInBackground(std::move(completion), Error::posix(ENOENT, path_));
      return;
    }
    book->beginRemoval(path_);
    removeAndRelease(book, path_, std::move(completion));
  }

 private:
  const std::string path_;
  const QVTemporaryFiles files_;
  platform::Guarded<Book> book_;
};

class Claim final : public MovieClaim {
 public:
  Claim(Book book, std::string path) : right_(std::move(book), std::move(path)) {}
  ~Claim() override {
    if (const Book book = right_.use()) book->release(path());
  }
  [[nodiscard]] const std::string& path() const override { return right_.path(); }
  [[nodiscard]] bool hasFile() const override { return right_.hasFile(); }
  void handTo(const std::string& owner) override {
    if (const Book book = right_.use()) book->hand(path(), owner);
  }
  std::shared_ptr<MovieSave> saveFor(const std::string& owner) override;
  void remove(FileCompletion completion) override { right_.useForRemoval(std::move(completion)); }

 private:
  Right right_;
};

class Save final : public MovieSave {
 public:
  Save(Book book, const std::string& path) : right_(std::move(book), path), movie_(URL::fileURL(path)) {}
  ~Save() override {
    if (const Book book = right_.use()) book->giveBack(right_.path());
  }
  [[nodiscard]] const URL& movie() const override { return movie_; }
  void succeeded(FileCompletion completion) override { right_.useForRemoval(std::move(completion)); }

 private:
  Right right_;
  const URL movie_;
};

std::shared_ptr<MovieSave> Claim::saveFor(const std::string& owner) {
  const Book book = hasFile() ? right_.use() : nullptr;
  if (!book) return nullptr;
  book->beginStoring(path(), owner);
  return std::make_shared<Save>(book, path());
}

class Movies final : public QVTemporaryMovies {
 public:
  explicit Movies(QVTemporaryFiles files) : files_(files), book_(std::make_shared<MovieBook>(files)) {}
  ~Movies() override { book_->dropWaiting(); }

  void claimForRecording(const std::string& path, const std::string& owner, ClaimHandler handler) override {
    claim(path, owner, MovieBook::OwnMovie::Replace, handler);
  }
  std::shared_ptr<MovieClaim> claimNew(const std::string& path) override {
    return claimAt(book_->takeUnused(normalized(path)));
  }
  std::shared_ptr<MovieClaim> claimTrimmed(const std::string& path, const std::string& owner) override {
    return claimAt(book_->takeForCopy(normalized(path), owner));
  }

  [[nodiscard]] bool isHandedTo(const std::string& owner, const URL& movie) const override {
    const std::string path = normalized(movie.path());
    return book_->isHanded(path, owner) && files_.isMovieAt(path);
  }
  [[nodiscard]] platform::Result<platform::FileDescriptor> openHanded(const std::string& owner,
                                                                      const URL& movie) const override {
    auto file = book_->openHanded(normalized(movie.path()), owner);
    const bool isGone =
        !file || (!*file && file->error().domain == platform::kPosixErrorDomain && file->error().code == ENOENT);
    if (isGone) return recordingError(errorcode::kFailedToSave);
    return std::move(*file);
  }
  std::shared_ptr<MovieSave> beginSave(const std::string& owner, const URL& movie) override {
    const std::string path = normalized(movie.path());
    if (!book_->beginSave(path, owner)) return nullptr;
    // Looked at under the right, which no purge can take any more; without a file it goes back.
    auto save = std::make_shared<Save>(book_, path);
    return files_.isMovieAt(path) ? save : nullptr;
  }
  void discardLast(const std::string& owner, FileCompletion completion) override {
    const auto discard = book_->beginDiscard(owner, [weak = weak_from_this(), owner, completion] {
      if (const auto self = weak.lock()) self->discardLast(owner, completion);
    });
    if (discard.path) {
      removeAndRelease(book_, *discard.path, std::move(completion));
    } else if (!discard.waits) {
      files_.answerInBackground(std::move(completion), std::nullopt);
    }
  }

  std::map<std::string, MovieStanding> standings() const override { return book_->standings(); }

  int64_t deleteFilesOlderThanTimeToLiveInSeconds(double timeToLive) override {
    return files_._srDeleteFilesOlderThanTimeToLiveInSeconds(timeToLive, purging());
  }
  int64_t deleteAllTempFiles() override { return files_._srDeleteAllTempFiles(purging()); }

 private:
  void claim(const std::string& path, const std::string& owner, MovieBook::OwnMovie own, const ClaimHandler& handler) {
    const auto whenSettled = [weak = weak_from_this(), path, owner, handler] {
      const auto self = std::static_pointer_cast<Movies>(weak.lock());
      // A movie that could not be saved is its application's still, and was wanted a moment ago.
      if (self) self->claim(path, owner, MovieBook::OwnMovie::Keep, handler);
    };
    if (const auto taken = book_->takeForRecording(normalized(path), owner, own, whenSettled)) {
      handler(claimAt(*taken));
    }
  }
  [[nodiscard]] std::shared_ptr<MovieClaim> claimAt(const std::string& path) const {
    return std::make_shared<Claim>(book_, path);
  }
  /// Nobody makes or saves a movie while it is purged.
  [[nodiscard]] RemovalRight purging() const {
    return [book = book_](const std::string& path) -> std::shared_ptr<void> {
      const std::string at = normalized(path);
      if (!book->beginPurge(at)) return nullptr;
      return {book.get(), [book, at](void*) { endPurge(*book, at); }};
    };
  }

  const QVTemporaryFiles files_;
  const Book book_;
};

}  // namespace

std::shared_ptr<QVTemporaryMovies> QVTemporaryMovies::create(QVTemporaryFiles files) {
  return std::make_shared<Movies>(files);
}

}  // namespace qv
