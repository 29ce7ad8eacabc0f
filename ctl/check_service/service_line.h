// Thread safety: every member may be called from any thread but the IPC thread.
//
// The connection to a service under check, as the daemon has one, with nothing smoothed over:
// answers that come twice, errors and answers of the wrong form are kept for whoever asks.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "support/ipc/arguments.h"
#include "support/ipc/connection.h"
#include "support/ipc/linux/ipc_loop.h"

namespace spacekeep::ctl {

class ServiceLine {
 public:
  using CallNumber = std::size_t;

  struct Call {
    std::string member;
    std::uint64_t sent_ticks = 0;
    std::uint64_t answered_ticks = 0;      ///< of the first answer
    std::optional<ipc::Arguments> answer;  ///< of the form that the interface has
    std::optional<ipc::Error> error;  ///< the service answered with an error, or in another form
    unsigned answers = 0;
    bool lost = false;  ///< the connection ended before an answer came

    [[nodiscard]] bool settled() const { return answers > 0 || lost; }
  };

  /// Over a connected unix stream socket on whose other end the service answers.
  ServiceLine(ipc::IpcLoop& loop, const ipc::SharedDescriptor& socket);
  /// Closes the connection.
  ~ServiceLine();
  ServiceLine(const ServiceLine&) = delete;
  ServiceLine& operator=(const ServiceLine&) = delete;

  /// A member of the service's interface.
  CallNumber call(std::string_view member, ipc::Arguments arguments);
  /// Also what is not in the interface, or is described otherwise there.
  CallNumber callAs(ipc::MethodDescription method, ipc::Arguments arguments);
  /// The call as it stands once it is settled, or when the time is up.
  [[nodiscard]] Call waitFor(CallNumber number, std::uint64_t timeout_ns) const;

  /// The service has taken the connection.
  [[nodiscard]] bool ready() const;
  /// Why the connection has ended; none while it stands.
  [[nodiscard]] std::optional<std::string> ended() const;
  /// What was answered more than once, and answers to nothing that was asked.
  [[nodiscard]] std::vector<std::string> surplusAnswers() const;

 private:
  struct Record;
  class Wire;

  ipc::IpcLoop& loop_;
  const std::shared_ptr<Record> record_;
  std::shared_ptr<Wire> wire_;
};

}  // namespace spacekeep::ctl
