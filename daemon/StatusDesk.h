#pragma once

#include <memory>

#include "daemon/ServicesLook.h"
#include "daemon/StartConditions.h"
#include "platform/IPC.h"
#include "platform/threads/LogQuotas.h"

namespace qv {

/// Serves the read-only interface: what records, what a start would find, what lies in the store, how the device is.
///
/// Threading: sequence only; what it is given is borrowed.
class StatusDesk final : public platform::IPCExportedObject {
 public:
  StatusDesk(platform::SerialQueue& sequence, RecordingContext& context, SessionRegistry& sessions,
             ForegroundFollower& foreground, const QVExemptionBook& exemptions, platform::LogQuotas& logQuotas);

  void handleCall(const std::shared_ptr<platform::IPCConnection>& connection, const platform::IPCOperation& operation,
                  platform::IPCArguments arguments, platform::IPCReply reply) override;

 private:
  void serve(const Caller& caller, const status::GetRecordings& request, const platform::IPCReply& reply) const;
  void serve(const Caller& caller, const status::GetStartConditions& request, const platform::IPCReply& reply) const;
  void serve(const Caller& caller, const status::GetMovies& request, const platform::IPCReply& reply) const;
  void serve(const Caller& caller, const status::GetDevice& request, const platform::IPCReply& reply) const;
  [[nodiscard]] platform::Dictionary device(const platform::DeviceServices& services) const;

  RecordingContext& context_;
  SessionRegistry& sessions_;
  const StartConditions conditions_;
  platform::LogQuotas& logQuotas_;
  const std::shared_ptr<ServicesLook> services_;
};

}  // namespace qv
