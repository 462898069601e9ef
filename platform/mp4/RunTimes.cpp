#include "platform/mp4/RunTimes.h"

#include <algorithm>
#include <limits>

namespace qv::platform::mp4 {
namespace {

constexpr int64_t kLongestStep = std::numeric_limits<uint32_t>::max();

/// Marks the runs of a longest sequence whose times rise: one damaged time costs no more than itself.
std::vector<bool> fittingRuns(const std::vector<SampleRun>& runs) {
  std::vector<size_t> lastOfLength;  // of those sequences of this length that end lowest
  std::vector<size_t> before(runs.size());
  for (size_t i = 0; i < runs.size(); ++i) {
    const auto at = std::lower_bound(lastOfLength.begin(), lastOfLength.end(), runs[i].decodeTime,
                                     [&](size_t run, int64_t time) { return runs[run].decodeTime < time; });
    before[i] = at == lastOfLength.begin() ? i : *(at - 1);
    if (at == lastOfLength.end()) {
      lastOfLength.push_back(i);
    } else {
      *at = i;
    }
  }
  std::vector<bool> fits(runs.size());
  if (lastOfLength.empty()) return fits;
  size_t run = lastOfLength.back();
  for (fits[run] = true; before[run] != run; fits[run] = true) run = before[run];
  return fits;
}

/// Where the first run at or behind `from` with a time of its own begins.
int64_t nextStart(const std::vector<SampleRun>& runs, const std::vector<bool>& fits, size_t from) {
  while (from < runs.size() && !fits[from]) ++from;
  return from < runs.size() ? runs[from].decodeTime : std::numeric_limits<int64_t>::max();
}

}  // namespace

std::vector<std::vector<int64_t>> timesOf(const std::vector<SampleRun>& runs) {
  const auto fits = fittingRuns(runs);
  std::vector<std::vector<int64_t>> times;
  int64_t last = -1;
  int64_t following = 0;  // the end of the run before
  for (size_t i = 0; i < runs.size(); ++i) {
    const int64_t limit = nextStart(runs, fits, i + 1);
    auto left = static_cast<int64_t>(runs[i].entries.size());
    int64_t time = fits[i] ? runs[i].decodeTime : following;
    times.emplace_back();
    for (const SampleRun::Entry& entry : runs[i].entries) {
      int64_t placed = std::max(std::min(time, limit - left--), last + 1);
      if (last >= 0) placed = std::min(placed, last + kLongestStep);
      times.back().push_back(placed);
      last = placed;
      following = placed + entry.duration;
      time = following;
    }
  }
  return times;
}

}  // namespace qv::platform::mp4
