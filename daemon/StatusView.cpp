#include "daemon/StatusView.h"

#include <unistd.h>

namespace qv {

StatusView::StatusView(const Caller& caller) : user_(caller.user()), seesAll_(user_ == 0 || user_ == ::geteuid()) {}

bool StatusView::seesOwner(const std::string& owner) const {
  return seesAll_ || (!owner.empty() && owner == applicationOwner(owner.substr(0, owner.rfind(':')), user_));
}

}  // namespace qv
