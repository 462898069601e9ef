#include <gtest/gtest.h>
#include <sys/resource.h>

#include "platform/ffmpeg/MoviesLoader.h"
#include "platform/threads/Log.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::security {
namespace {

/// Less than the process has open: nothing can be opened.
class NoDescriptors {
 public:
  NoDescriptors() {
    ::getrlimit(RLIMIT_NOFILE, &former_);
    rlimit none = former_;
    none.rlim_cur = 3;
    ::setrlimit(RLIMIT_NOFILE, &none);
  }
  ~NoDescriptors() { ::setrlimit(RLIMIT_NOFILE, &former_); }
  NoDescriptors(const NoDescriptors&) = delete;
  NoDescriptors& operator=(const NoDescriptors&) = delete;

 private:
  rlimit former_{};
};

TEST(ModulesTest, ALoadThatFailedForWantOfDescriptorsIsTriedAgain) {
  const kit::ScratchFolder folder;
  platform::ffmpeg::MoviesLoader loader(QV_MOVIE_MODULES);
  const auto movie = platform::URL::fileURL(folder / "movie.mp4");
  // Its thread is begun with the first line, and a sanitizer that looks at a new thread needs descriptors.
  QV_LOG(platform::logs::kPlatform, "the log has begun");
  {
    const NoDescriptors exhausted;
    EXPECT_FALSE(loader.createAssetWriter(movie, platform::kFileTypeMPEG4).hasValue());
    EXPECT_EQ(loader.createWriterInput(platform::MediaType::Video, {}), nullptr);
  }
  const auto writer = loader.createAssetWriter(movie, platform::kFileTypeMPEG4);
  EXPECT_TRUE(writer.hasValue()) << writer.error().description();
}

}  // namespace
}  // namespace qv::security
