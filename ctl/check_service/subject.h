// Thread safety: for one thread.
//
// The service under check: how it is reached, lost and reached again, and how it is asked. What is
// wrong with answers of any kind is noted in the ledger as they come.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "ctl/check_service/daemon_stand_in.h"
#include "ctl/check_service/launched_service.h"
#include "ctl/check_service/ledger.h"
#include "ctl/check_service/service_line.h"
#include "sdk/engine.h"

namespace spacekeep::ctl {

struct SubjectOptions {
  std::vector<std::string> command;  ///< empty: the service listens at `endpoint` already
  std::string endpoint;
  std::uint64_t patience_ns = 0;  ///< then an answer counts as missing
};

/// One answer to one request, or why there is none.
struct Asked {
  std::optional<Dictionary> answer;  ///< empty also when the service answered with no dictionary
  bool without_dictionary = false;
  std::string problem;  ///< "was not answered within 20 s"; empty when there is an answer
  bool silent = false;  ///< neither an answer nor an error came, and the connection stands
  std::uint64_t elapsed_ns = 0;
};

class Subject {
 public:
  Subject(SubjectOptions options, std::string folder);
  ~Subject();
  Subject(const Subject&) = delete;
  Subject& operator=(const Subject&) = delete;

  /// Opens the door to the service, starts it and waits for it. Answers why it could not even be
  /// tried: no such program, nobody at the socket.
  [[nodiscard]] std::string begin();
  /// Waits until the service can be asked: it has checked in, or has taken a connection. Answers
  /// what is wrong, empty when it can.
  [[nodiscard]] std::string reach(std::uint64_t timeout_ns);
  /// reach(), and starts the service again when its process has ended, as a service manager would.
  [[nodiscard]] std::string reachAgain();
  /// As if the daemon's process had ended.
  void goAway();
  /// As if the daemon had been started again.
  [[nodiscard]] std::string comeBack();

  /// servicePurgeable, servicePurge or servicePeriodic; `limit_ns` is how long the daemon would wait.
  /// What was not answered once is not asked again.
  [[nodiscard]] Asked ask(const char* member, int urgency, const Dictionary& info,
                          std::uint64_t limit_ns);
  /// The answer to a call made on line(), with its problem in words. The ledger hears nothing.
  [[nodiscard]] Asked answerTo(ServiceLine::CallNumber call);
  [[nodiscard]] ServiceLine& line() { return *line_; }
  [[nodiscard]] bool reachable() const { return line_ != nullptr && !line_->ended(); }

  [[nodiscard]] bool checkedIn() const { return check_in_.has_value(); }
  [[nodiscard]] const CheckIn& checkIn() const { return *check_in_; }
  /// "com.example.cache", or where it listens.
  [[nodiscard]] std::string name() const;
  [[nodiscard]] std::optional<pid_t> pid() const;
  /// How its process ended; none while it runs, or when nobody can tell.
  [[nodiscard]] std::optional<std::string> processEnd();
  /// A service behind a socket may end when it has nothing to do; it is started at the next call.
  [[nodiscard]] bool endedInPeace();
  [[nodiscard]] std::string outputPath() const { return folder_ + "/output"; }
  [[nodiscard]] std::uint64_t patienceNs() const { return options_.patience_ns; }
  [[nodiscard]] Ledger& ledger() { return ledger_; }
  /// Of all connections so far.
  [[nodiscard]] std::vector<std::string> surplusAnswers() const;

 private:
  [[nodiscard]] std::string launch();
  [[nodiscard]] bool tryToConnect();
  void judge(const char* member, int urgency, const Asked& asked, std::uint64_t limit_ns);
  void closeLine();
  void takeUp(CheckIn check_in);

  const SubjectOptions options_;
  const std::string folder_;
  sdk::Engine engine_;
  DaemonStandIn daemon_;
  ipc::SharedDescriptor listening_;  ///< handed over to the service
  std::unique_ptr<LaunchedService> process_;
  std::unique_ptr<ServiceLine> line_;
  std::optional<CheckIn> check_in_;
  std::vector<std::string> surplus_;
  Ledger ledger_;
};

}  // namespace spacekeep::ctl
