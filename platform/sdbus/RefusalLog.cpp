#include "platform/sdbus/RefusalLog.h"

#include "platform/threads/Log.h"

namespace qv::platform::sdbus {

void RefusalLog::note(uid_t user, const std::string& what) {
  Second& second = seconds_[user];
  if (second.end) {
    ++second.others;
    second.last = what;
    return;
  }
  QV_LOG_ERROR(logs::kIPC, "a peer of user %u: %s", user, what.c_str());
  begin(user, second);
}

void RefusalLog::begin(uid_t user, Second& second) {
  second.others = 0;
  second.end = loop_.after(std::chrono::seconds(1), [this, user] { sumUp(user); });
}

void RefusalLog::sumUp(uid_t user) {
  Second& second = seconds_[user];
  if (second.others == 0) {
    seconds_.erase(user);
    return;
  }
  QV_LOG_ERROR(logs::kIPC, "peers of user %u: %zu more in a second, the last one: %s", user, second.others,
               second.last.c_str());
  begin(user, second);
}

}  // namespace qv::platform::sdbus
