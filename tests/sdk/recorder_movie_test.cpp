#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "tests/kit/ScratchFolder.h"
#include "tests/sdk/RecorderFixture.h"

namespace qv::client {
namespace {

class RecorderMovie : public RecorderFixture {
 protected:
  quorvel::OpenMovieResult open(platform::IPCArguments answer) {
    quorvel::OpenMovieResult result;
    recorder_->openMovie("file:///store/a%20b.mp4", [&](quorvel::OpenMovieResult movie) { result = std::move(movie); });
    auto call = takeCall();
    EXPECT_EQ(call.member, "openMovieAtURL");
    EXPECT_EQ(call.arguments, (platform::IPCArguments{"file:///store/a%20b.mp4"}));
    call.reply(std::move(answer));
    run();
    return result;
  }
};

TEST_F(RecorderMovie, AnOpenMovieLivesAsLongAsItsHolder) {
  const kit::ScratchFolder folder;
  const std::string path = folder.write("/movie", "content");
  auto movie =
      open({Array{Value(platform::shareFileDescriptor(platform::FileDescriptor(::open(path.c_str(), O_RDONLY))))},
            Dictionary()});
  ASSERT_FALSE(movie.error);
  char bytes[16];
  EXPECT_EQ(std::string(bytes, static_cast<size_t>(::read(movie.file, bytes, sizeof bytes))), "content");
  movie.holder.reset();
  EXPECT_EQ(::fcntl(movie.file, F_GETFD), -1) << "it is closed";
}

TEST_F(RecorderMovie, AnAnswerWithoutAMovieIsAnError) {
  EXPECT_EQ(open({Array(), platform::encodeError(platform::Error::posix(EMFILE))}).error.value().code, EMFILE);
  for (const auto& files : {Array(), Array{1}}) {
    const auto movie = open({files, Dictionary()});
    EXPECT_EQ(movie.error.value().code, quorvel::kErrorUnknown);
    EXPECT_EQ(movie.file, -1);
  }
}

}  // namespace
}  // namespace qv::client
