#include "tests/pulse/PulseFixture.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/inotify.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <numbers>

#include "platform/pulse/PulsePlatform.h"
#include "platform/sound/PCMSource.h"

namespace qv::platform {
namespace {

constexpr size_t kRate = 44100;
constexpr std::chrono::seconds kPatience(20);

bool isInstalled(const std::string& program) {
  std::stringstream path(std::getenv("PATH"));
  for (std::string directory; std::getline(path, directory, ':');) {
    if (::access((directory + "/" + program).c_str(), X_OK) == 0) return true;
  }
  return false;
}

void endProcess(pid_t pid, int signal) {
  if (pid <= 0) return;
  ::kill(pid, signal);
  ::waitpid(pid, nullptr, 0);
}

}  // namespace

TonePlayer::TonePlayer(const std::string& server, bool playsInChild) {
  int in[2], out[2];
  if (::pipe2(in, O_CLOEXEC) != 0 || ::pipe2(out, O_CLOEXEC) != 0) std::abort();
  pid_ = ::fork();
  if (pid_ == 0) {
    ::dup2(in[0], 0);
    ::dup2(out[1], 1);
    ::execl(TONE_PLAYER, "tone_player", server.c_str(), playsInChild ? "--fork" : nullptr, nullptr);
    ::_exit(127);
  }
  ::close(in[0]);
  ::close(out[1]);
  input_.reset(in[1]);
  output_.reset(out[0]);
}

TonePlayer::~TonePlayer() {
  input_.reset();  // it ends, and its child too
  ::waitpid(pid_, nullptr, 0);
}

std::string TonePlayer::tell(const std::string& line) {
  const std::string text = line + "\n";
  if (::write(input_.get(), text.data(), text.size()) < 0) return {};
  std::string answer;
  for (char c = 0; ::read(output_.get(), &c, 1) == 1 && c != '\n';) answer += c;
  return answer;
}

uint64_t TonePlayer::sound() {
  const std::string answer = tell("tone");
  return answer.starts_with("onset ") ? std::stoull(answer.substr(6)) : 0;
}

double amplitudeOf(double frequency, std::span<const int16_t> samples) {
  const double coefficient = 2 * std::cos(2 * std::numbers::pi * frequency / kRate);
  double s1 = 0, s2 = 0;
  for (const int16_t sample : samples) {
    const double s0 = sample + coefficient * s1 - s2;
    s2 = s1;
    s1 = s0;
  }
  return 2 * std::sqrt(s1 * s1 + s2 * s2 - coefficient * s1 * s2) / static_cast<double>(samples.size());
}

void Capture::add(uint64_t hostTime, const uint8_t* bigEndian, size_t frames) {
  std::lock_guard lock(mutex_);
  starts_.emplace_back(samples_.size(), hostTime);
  for (size_t i = 0; i < frames; ++i) {
    samples_.push_back(static_cast<int16_t>(bigEndian[2 * i] << 8 | bigEndian[2 * i + 1]));
  }
  changed_.notify_all();
}

bool Capture::waitForTone(double frequency) {
  std::unique_lock lock(mutex_);
  size_t begin = samples_.size();
  return changed_.wait_for(lock, kPatience, [&] {
    for (; begin + kRate / 10 <= samples_.size(); begin += kRate / 10) {
      if (amplitudeOf(frequency, {samples_.data() + begin, kRate / 10}) > 7000) return true;
    }
    return false;
  });
}

std::vector<int16_t> Capture::next(size_t frames) {
  std::unique_lock lock(mutex_);
  const size_t begin = samples_.size();
  if (!changed_.wait_for(lock, kPatience, [&] { return samples_.size() >= begin + frames; })) return {};
  return {samples_.begin() + static_cast<ptrdiff_t>(begin), samples_.begin() + static_cast<ptrdiff_t>(begin + frames)};
}

uint64_t Capture::firstSound() {
  std::lock_guard lock(mutex_);
  for (size_t part = 0; part < starts_.size(); ++part) {
    const size_t end = part + 1 < starts_.size() ? starts_[part + 1].first : samples_.size();
    for (size_t i = starts_[part].first; i < end; ++i) {
      if (std::abs(samples_[i]) > 800) return starts_[part].second + (i - starts_[part].first) * 1'000'000'000 / kRate;
    }
  }
  return 0;
}

uint64_t Capture::end() {
  std::lock_guard lock(mutex_);
  if (starts_.empty()) return 0;
  const auto& [index, hostTime] = starts_.back();
  return hostTime + (samples_.size() - index) * 1'000'000'000 / kRate;
}

std::vector<int16_t> Capture::from(uint64_t hostTime) {
  const uint64_t last = end();
  std::lock_guard lock(mutex_);
  const size_t wanted = hostTime < last ? (last - hostTime) * kRate / 1'000'000'000 : 0;
  return {samples_.end() - static_cast<ptrdiff_t>(std::min(wanted, samples_.size())), samples_.end()};
}

bool Capture::isContinuous() {
  std::lock_guard lock(mutex_);
  for (const auto& [index, hostTime] : starts_) {
    const double expected = static_cast<double>(index) / kRate * 1e9;
    if (std::abs(static_cast<double>(hostTime - starts_[0].second) - expected) > 2) return false;
  }
  return true;
}

void PulseTest::SetUp() {
  if (!isInstalled("pulseaudio")) GTEST_SKIP() << "pulseaudio is not installed";
  char name[] = "/tmp/qv-pulse-XXXXXX";
  ASSERT_NE(::mkdtemp(name), nullptr);
  directory_ = name;
  // The socket comes last: with it everything else is there.
  std::ofstream(directory_ + "/script.pa") << "load-module module-null-sink norewinds=1 sink_name=appout\n"
                                              "load-module module-null-sink norewinds=1 sink_name=other\n"
                                              "load-module module-null-sink norewinds=1 sink_name=micsrc\n"
                                              "load-module module-remap-source master=micsrc.monitor source_name=mic\n"
                                              "set-default-sink appout\n"
                                              "set-default-source mic\n"
                                              "load-module module-native-protocol-unix auth-anonymous=1 socket="
                                           << directory_ << "/socket\n";
  ::setenv("HOME", name, 1);
  ::setenv("XDG_RUNTIME_DIR", name, 1);
  startServer();
}

void PulseTest::startServer() {
  const FileDescriptor watch(::inotify_init1(IN_CLOEXEC));
  ::inotify_add_watch(watch.get(), directory_.c_str(), IN_CREATE);
  const std::string script = directory_ + "/script.pa";
  serverPid_ = ::fork();
  if (serverPid_ == 0) {
    const int log = ::open((directory_ + "/log").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
    ::dup2(log, 1);
    ::dup2(log, 2);
    ::execlp("pulseaudio", "pulseaudio", "-n", "--daemonize=no", "--exit-idle-time=-1", "--disallow-exit=yes",
             "--use-pid-file=no", "-F", script.c_str(), nullptr);
    ::_exit(127);
  }
  const auto end = std::chrono::steady_clock::now() + kPatience;
  while (!PulsePlatform::connect(server())) {
    ASSERT_LT(std::chrono::steady_clock::now(), end) << "pulseaudio does not start, see " << directory_ << "/log";
    pollfd created{watch.get(), POLLIN, 0};
    if (::poll(&created, 1, 200) > 0) {
      char events[4096];
      ASSERT_GT(::read(watch.get(), events, sizeof events), 0);
    }
  }
}

void PulseTest::killServer() {
  endProcess(serverPid_, SIGKILL);
  serverPid_ = 0;
  ::unlink((directory_ + "/socket").c_str());
}

void PulseTest::TearDown() {
  endProcess(serverPid_, SIGTERM);
  if (!directory_.empty() && !HasFailure()) std::filesystem::remove_all(directory_);
}

std::unique_ptr<AppAudioTapQueue> PulseTest::tap(AppAudioTapService& service, pid_t process, Capture& capture) {
  struct Owner {
    AppAudioTapQueue* queue = nullptr;
  };
  auto owner = std::make_shared<Owner>();
  std::unique_ptr<AppAudioTapQueue> queue;
  const auto callback = [owner, &capture](QueueBuffer* buffer, const AudioTimeStamp& start, uint32_t packets) {
    capture.add(start.hostTime, buffer->data, packets);
    EXPECT_EQ(0, owner->queue->enqueueBuffer(buffer));
  };
  EXPECT_EQ(0, service.createInputQueue(PCMFormat{}.description(), callback, 0x800, queue));
  if (!queue) return nullptr;
  owner->queue = queue.get();
  EXPECT_EQ(0, queue->setTappedProcess(process));
  for (int i = 0; i < 10; ++i) {
    QueueBuffer* buffer = nullptr;
    EXPECT_EQ(0, queue->allocateBuffer(57344, buffer));
    EXPECT_EQ(0, queue->enqueueBuffer(buffer));
  }
  EXPECT_EQ(0, queue->start());
  return queue;
}

}  // namespace qv::platform
