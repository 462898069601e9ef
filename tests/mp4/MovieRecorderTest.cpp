#include <gtest/gtest.h>

#include <chrono>
#include <future>
#include <semaphore>

#include "platform/mp4/MovieRecorder.h"
#include "tests/mp4/SmallMovie.h"

namespace qv::platform::mp4 {
namespace {

/// By the samples' times. The disk lags: it begins when all has been appended.
TEST(MovieRecorderTest, RecordsInFragmentsWithOrWithoutAFinish) {
  const auto timeOf = [](int64_t i) { return i * 3000 - (i < 48 ? 0 : 24); };  // 48 is just within its fragment
  for (const bool isFinished : {true, false}) {
    Disk disk, wanted;
    std::promise<void> appended, told;
    std::string thread(16, 0);
    disk.atFirst = [&] {
      appended.get_future().wait();
      ::pthread_getname_np(::pthread_self(), thread.data(), thread.size());
    };
    {
      MovieRecorder recorder(std::make_unique<MemoryFile>(disk), tracks(), [](const Error&) { ADD_FAILURE(); });
      for (int64_t i = 0; i < 60; ++i) {
        recorder.append(0, sample(5, timeOf(i), 2000, i % 10 == 0));
        recorder.append(1, sample(2, i * 1500, 1500));
      }
      const auto done = [&](const auto& error) {
        EXPECT_FALSE(error);
        told.set_value();
      };
      isFinished ? recorder.finish({}, done) : told.set_value();
      appended.set_value();
      told.get_future().wait();
    }
    EXPECT_STREQ(thread.c_str(), "qv-movie-file");
    MovieWriter writer(std::make_unique<MemoryFile>(wanted), tracks(), MovieWriter::Layout::Fragmented);
    ASSERT_FALSE(writer.writeHeader());
    Fragment fragment(2);
    for (int64_t i = 0; i < 60; ++i) {
      // The last picture of a fragment lasts until the next one.
      const bool isLast = i == 23 || i == 48;
      fragment[0].push_back(sample(5, timeOf(i), isLast ? 3000 : 2000, i % 10 == 0));
      fragment[1].push_back(sample(2, i * 1500, 1500));
      ASSERT_FALSE((isLast || i == 59) && writer.writeFragment(std::exchange(fragment, Fragment(2))));
    }
    ASSERT_FALSE(isFinished && writer.finish({}));
    EXPECT_EQ(disk.bytes, wanted.bytes);
  }
}

/// What comes singly is on disk after the time of a fragment, without more to come.
TEST(MovieRecorderTest, RecordsByTheClockWhatNothingFollows) {
  Disk disk;
  std::counting_semaphore<> synced(0);
  disk.atSync = [&] { synced.release(); };
  MovieRecorder recorder(std::make_unique<MemoryFile>(disk), tracks(), [](const Error&) { ADD_FAILURE(); });
  for (int64_t i = 0; i < 2; ++i) {
    const auto begin = std::chrono::steady_clock::now();
    recorder.append(0, sample(i == 0 ? MovieRecorder::kMaximumQueuedBytes : 1, i * 9000, 3000));
    synced.acquire();
    EXPECT_GE(std::chrono::steady_clock::now() - begin, MovieRecorder::kFragmentLength);
  }
}

TEST(MovieRecorderTest, ARecorderWhoseDiskFailsTellsItAndHoldsNobodyUp) {
  Disk disk;
  std::promise<void> isFull;
  std::vector<int64_t> codes;
  disk.failsAt = 0;
  disk.atFirst = [&] { isFull.get_future().wait(); };
  {
    MovieRecorder recorder(std::make_unique<MemoryFile>(disk), tracks(),
                           [&](const Error& e) { codes.push_back(e.code); });
    recorder.append(0, sample(MovieRecorder::kMaximumQueuedBytes, 0, 3000));
    isFull.set_value();
    recorder.append(0, sample(MovieRecorder::kMaximumQueuedBytes, 90000, 3000));
    recorder.append(0, sample(1, 180000, 3000));
    recorder.finish({}, [&](const auto& e) { codes.push_back(e ? e->code : 0); });
  }
  EXPECT_EQ(codes, (std::vector<int64_t>{ENOSPC, ENOSPC}));
  EXPECT_TRUE(disk.bytes.empty());
}

}  // namespace
}  // namespace qv::platform::mp4
