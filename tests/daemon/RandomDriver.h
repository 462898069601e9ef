#pragma once

#include <array>
#include <deque>
#include <memory>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "tests/daemon/DaemonTest.h"
#include "tests/daemon/RecordingModel.h"

namespace qv {

/// Three applications, two of one name, and the system's interface, which ask one daemon for this and that in random
/// order, while the device around it fails, holds back and takes its time. Between two steps the daemon does some of
/// its work, all of it or none.
///
/// Sources: RandomDriver.cpp (steps, answers, what must hold), _clients (what applications do), _device (what befalls
/// them).
class RandomDriver : public DaemonTest {
 public:
  explicit RandomDriver(uint64_t seed);
  ~RandomDriver() override;
  void TestBody() override {}

  /// False when something did not hold: then `report` tells what, and what went before.
  bool run(int steps);
  /// Ends everything; nothing may be left.
  bool finish();
  [[nodiscard]] std::string report() const;
  [[nodiscard]] size_t certainChecks() const { return model_.certainChecks(); }

 private:
  using App = RecordingModel::App;
  enum class Kind { Start, Stop, StopTrimmed, Save, Discard, SetUp };
  struct Request {
    App app = 0;
    Kind kind = Kind::Start;
    uint64_t id = 0;
    bool makesMovie = false;  ///< a start
    std::string name;         ///< of the movie to be saved
    TestClient::Slot slot;
  };
  struct Actor {
    std::string bundleID;
    pid_t pid = 0;
    uint32_t context = 0;
    std::unique_ptr<TestClient> client;
    std::map<std::string, std::string> urls = {};  ///< as they were handed over, by name
  };
  struct Step {
    size_t weight;
    const char* name;
    void (*act)(RandomDriver&);
  };
  static constexpr App kGame = 0, kNamesake = 1, kChat = 2, kSystem = 3;
  static constexpr size_t kTraceLength = 80;

  static const std::vector<Step>& clientSteps();
  static const std::vector<Step>& deviceSteps();
  size_t pick(size_t count) { return count == 0 ? 0 : random_() % count; }
  bool chance(int percent) { return static_cast<int>(pick(100)) < percent; }
  void trace(const std::string& text);
  App pickApp() { return pick(actors_.size()); }
  /// Most of the time the one that began to record last.
  App pickRecordingApp() { return chance(70) ? lastStarted_ : pickApp(); }

  // --- Answers.
  void runPieces(int count);
  void poll();
  void resolve(const Request& request, const TestClient::Answer& answer);
  void takeHanded(App app, const std::string& url);
  [[nodiscard]] bool mayLose(App app, const std::string& name) const;
  std::string contentOf(const std::string& name) {
    return contentAt("file://" + std::string(fakes::kStore) + "/" + name);
  }
  [[nodiscard]] std::string savedContent(const std::string& name) const;
  void checkMoviesBeingWritten();

  // --- Rest: nothing is under way any more.
  void settle();
  bool answerSomebody();
  void checkRest();
  void checkSources(int recording);
  void checkStore();

  // --- Clients.
  void connect(App app, bool waits);
  void leave(App app);
  void tell(App app, const char* member, platform::IPCArguments arguments = {});
  /// Like `tell`, of what the model follows.
  void post(App app, Kind kind, const char* member, platform::IPCArguments arguments = {}, const std::string& name = {},
            bool makesMovie = false);
  void start(App app);
  void save(App app, App owner);

  // --- The device.
  void answerAlert();
  void answerClip();
  bool connectExtension();
  void abandonWhatIsOpen();

  const uint64_t seed_;
  std::mt19937_64 random_{seed_};
  RecordingModel model_;
  std::array<Actor, 4> actors_;
  std::vector<Request> requests_;
  uint64_t lastRequest_ = 0;
  App lastStarted_ = 0;
  bool wasPurged_ = false;  ///< since the last rest
  /// What recordings left that ended without telling anybody of a movie: it ages out.
  std::set<std::string> abandoned_;
  size_t firstOpenMovie_ = 0, answeredClips_ = 0;
  std::vector<std::unique_ptr<fakes::FakeBroadcastExtension>> extensions_;
  std::deque<std::string> trace_;
};

}  // namespace qv
