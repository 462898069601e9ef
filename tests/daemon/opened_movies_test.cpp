#include <unistd.h>

#include <cerrno>

#include "daemon/OutgoingMovies.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

/// How applications read their movies.
class OpenedMoviesTest : public QuietDaemonTest {
 protected:
  static std::optional<TestClient::Answer> open(TestClient& client, const std::string& movie) {
    return client.request("openMovieAtURL", {Value(movie)});
  }
  /// What is read through the descriptor of an answer; the error's code where there is none.
  static std::string contentOf(const TestClient::Answer& answer) {
    if (answer.values.at(0).asArray().empty()) return std::to_string(answer.code(1));
    EXPECT_EQ(answer.code(1), 0);
    const auto* file = answer.values[0].asArray().at(0).getIf<platform::SharedFileDescriptor>();
    char bytes[64];
    const ssize_t count = ::pread((*file)->get(), bytes, sizeof bytes, 0);
    return {bytes, static_cast<size_t>(std::max<ssize_t>(count, 0))};
  }
  const std::string kNone = std::to_string(errorcode::kFailedToSave);
};

TEST_F(OpenedMoviesTest, OnlyAMovieThatWaitsIsOpened) {
  auto client = game();
  const std::string movie = recordMovie(client);
  const auto opened = open(client, movie);
  device_.exports.holds = true;
  client.post("saveVideoToCameraRoll", {Value(movie)});
  device_.run();
  EXPECT_EQ(contentOf(*open(client, movie)), kNone) << "it is being saved";
  for (const auto& session : device_.exports.sessions) session->end();
  device_.run();
  EXPECT_EQ(client.start()->code(), 0);
  sendFrame(2 * kSecond);
  EXPECT_EQ(contentOf(*open(client, movie)), kNone) << "the next one, at the same path, is still recorded";
  EXPECT_EQ(contentOf(*opened), "movie 0") << "what is open stays readable";
}

TEST_F(OpenedMoviesTest, AFileThatIsNoneOrCannotBeReadIsAnError) {
  auto client = game();
  const std::string movie = recordMovie(client);
  const std::string path = platform::URL(movie).path();
  device_.disk.failOn(fakes::ScratchDisk::Operation::Open, path, EIO);
  EXPECT_EQ(contentOf(*open(client, movie)), std::to_string(EIO));
  device_.disk.failOn(fakes::ScratchDisk::Operation::Open, path, 0);
  ASSERT_FALSE(device_.disk.removeItem(path));
  EXPECT_EQ(contentOf(*open(client, movie)), kNone);
  ASSERT_EQ(::symlink("/etc/passwd", device_.disk.at(path).c_str()), 0);
  EXPECT_EQ(contentOf(*open(client, movie)), std::to_string(EINVAL));
}

/// Answers that nobody reads keep descriptors of the daemon.
TEST_F(OpenedMoviesTest, AnApplicationThatTakesNoAnswersGetsNoMore) {
  auto client = game();
  auto other = chat();
  const std::string movie = recordMovie(client);
  const std::string others = recordMovie(other);
  std::vector<std::optional<TestClient::Answer>> untaken;
  for (size_t i = 0; i < OutgoingMovies::kMaximum; ++i) untaken.push_back(open(client, movie));
  EXPECT_EQ(contentOf(*untaken.back()), "movie 0");
  EXPECT_EQ(contentOf(*open(client, movie)), std::to_string(EMFILE));
  EXPECT_EQ(contentOf(*open(other, others)), "movie 1");
  untaken.erase(untaken.begin());
  EXPECT_EQ(contentOf(*open(client, movie)), "movie 0");
}

}  // namespace
}  // namespace qv
