#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace qv::platform {

/// A modal alert. A button that is not set is not shown.
struct UserAlertRequest {
  std::string header;
  std::string message;
  std::string defaultButton;
  std::string alternateButton;
  std::string otherButton;
  std::string localizationPath;  ///< where further texts could be found; may be empty
};

enum class UserAlertAnswer : int32_t { Default = 0, Alternate = 1, Other = 2, Cancelled = 3 };

/// An alert on the screen. Destroying it takes it away; its handler is then not called any more
/// (a call in progress is not waited for).
class UserAlert {
 public:
  virtual ~UserAlert() = default;
};

/// Asks the user something.
///
/// Texts are plain: no markup is interpreted. Closing the alert in any way other than by a
/// button, and the loss of the display, is Cancelled.
///
/// Threading: thread-safe. The handler is called once, on a thread of the service's.
class UserAlertService {
 public:
  virtual ~UserAlertService() = default;
  /// Nothing when the alert cannot be shown.
  virtual std::unique_ptr<UserAlert> present(const UserAlertRequest& request,
                                             std::function<void(UserAlertAnswer)> handler) = 0;
};

}  // namespace qv::platform
