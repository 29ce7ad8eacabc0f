#include "ctl/check_service/service_line.h"

#include <deque>
#include <map>
#include <utility>

#include "ctl/check_service/patience.h"
#include "registry/service_protocol.h"
#include "support/ipc/error_names.h"
#include "support/ipc/linux/bus_link.h"
#include "support/ipc/linux/wire_reader.h"
#include "support/ipc/linux/wire_writer.h"
#include "support/runtime/locks.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

// As the daemon's own connections to services have them.
constexpr ipc::LinkLimits kLimits{.authentication_ns = 30 * kSecondNs,
                                  .message_bytes = 1024 * 1024,
                                  .queued_messages = 257,
                                  .queued_bytes = 4 * 1024 * 1024};

std::string textOrEmpty(const char* text) { return text == nullptr ? "" : text; }

}  // namespace

/// What both threads see.
struct ServiceLine::Record {
  mutable rt::Mutex mutex;
  // Protected by mutex.
  std::vector<Call> calls;
  std::vector<std::string> surplus;
  std::optional<std::string> ended;
  bool ready = false;

  void end(const std::string& why) {
    const std::scoped_lock lock(mutex);
    if (!ended) ended = why;
    for (Call& call : calls) call.lost = call.lost || call.answers == 0;
  }
};

/// Confined to the IPC thread.
class ServiceLine::Wire final : public ipc::BusLink::Owner {
 public:
  Wire(ipc::IpcLoop& loop, std::shared_ptr<Record> record)
      : record_(std::move(record)),
        link_(loop, *this, ipc::Authentication::Role::kClient, kLimits) {}

  void start(int fd) { link_.start(fd, 0); }
  void close() {
    link_.close();
    record_->end("this tool closed it");
  }

  void send(CallNumber number, ipc::MethodDescription method, ipc::Arguments arguments) {
    if (!link_.ended() && !link_.ready()) {
      waiting_.push_back({number, std::move(method), std::move(arguments)});
      return;
    }
    if (!link_.ended()) sendNow(number, std::move(method), arguments);
  }

  void linkReady() override {
    {
      const std::scoped_lock lock(record_->mutex);
      record_->ready = true;
    }
    for (auto& held : std::exchange(waiting_, {})) {
      send(held.number, std::move(held.method), std::move(held.arguments));
    }
  }

  void linkMessage(sd_bus_message* message) override {
    std::uint8_t type = 0;
    std::uint64_t serial = 0;
    if (sd_bus_message_get_type(message, &type) < 0 || type == SD_BUS_MESSAGE_METHOD_CALL ||
        type == SD_BUS_MESSAGE_SIGNAL || sd_bus_message_get_reply_cookie(message, &serial) < 0) {
      return;
    }
    const auto asked = asked_.find(serial);
    const std::scoped_lock lock(record_->mutex);
    if (asked == asked_.end()) {
      record_->surplus.emplace_back("an answer to something that was never asked");
      return;
    }
    book(record_->calls[asked->second.number], message, asked->second.method);
  }

  void linkEnded(ipc::LinkEnd, const std::string& why) override { record_->end(why); }

 private:
  struct Held {
    CallNumber number;
    ipc::MethodDescription method;
    ipc::Arguments arguments;
  };
  struct Asked {
    CallNumber number;
    ipc::MethodDescription method;
  };

  void sendNow(CallNumber number, ipc::MethodDescription method, const ipc::Arguments& arguments) {
    sd_bus_message* message = nullptr;
    if (sd_bus_message_new_method_call(link_.bus(), &message, nullptr, ipc::kObjectPath,
                                       std::string(spacekeepServiceInterface().name).c_str(),
                                       std::string(method.name).c_str()) < 0) {
      return;
    }
    ipc::WireWriter writer(message);
    if (writer.write(method.in, arguments)) {
      if (const auto serial = link_.send(message, writer.bytes())) {
        asked_.emplace(*serial, Asked{number, std::move(method)});
      }
    }
    sd_bus_message_unref(message);
  }

  /// With the record's lock held.
  void book(Call& call, sd_bus_message* message, const ipc::MethodDescription& method) {
    if (++call.answers > 1) {
      record_->surplus.push_back(call.member + " was answered " + std::to_string(call.answers) +
                                 " times");
      return;
    }
    call.answered_ticks = rt::ticks();
    if (const sd_bus_error* error = sd_bus_message_get_error(message)) {
      call.error = ipc::Error{textOrEmpty(error->name), textOrEmpty(error->message)};
      return;
    }
    ipc::WireReader reader(message, {});
    call.answer = reader.read(method.out);
    if (!call.answer) call.error = ipc::Error{ipc::kErrorInconsistentMessage, reader.problem()};
  }

  const std::shared_ptr<Record> record_;
  ipc::BusLink link_;
  std::deque<Held> waiting_;              // until the service has taken the connection
  std::map<std::uint64_t, Asked> asked_;  // by serial; kept, so that a second answer is known
};

ServiceLine::ServiceLine(ipc::IpcLoop& loop, const ipc::SharedDescriptor& socket)
    : loop_(loop), record_(std::make_shared<Record>()) {
  loop_.runAndWait([&] {
    wire_ = std::make_shared<Wire>(loop_, record_);
    wire_->start(socket == nullptr ? -1 : socket->fd());
  });
}

ServiceLine::~ServiceLine() {
  loop_.runAndWait([this] {
    wire_->close();
    wire_.reset();
  });
}

ServiceLine::CallNumber ServiceLine::call(std::string_view member, ipc::Arguments arguments) {
  return callAs(*spacekeepServiceInterface().method(member), std::move(arguments));
}

ServiceLine::CallNumber ServiceLine::callAs(ipc::MethodDescription method,
                                            ipc::Arguments arguments) {
  CallNumber number = 0;
  {
    const std::scoped_lock lock(record_->mutex);
    number = record_->calls.size();
    Call call;
    call.member = std::string(method.name);
    call.sent_ticks = rt::ticks();
    call.lost = record_->ended.has_value();
    record_->calls.push_back(std::move(call));
  }
  loop_.post([wire = wire_, number, method = std::move(method),
              arguments = std::move(arguments)]() mutable {
    wire->send(number, std::move(method), std::move(arguments));
  });
  return number;
}

ServiceLine::Call ServiceLine::waitFor(CallNumber number, std::uint64_t timeout_ns) const {
  const auto now = [&] {
    const std::scoped_lock lock(record_->mutex);
    return record_->calls.at(number);
  };
  within(timeout_ns, [&] { return now().settled(); });
  return now();
}

bool ServiceLine::ready() const {
  const std::scoped_lock lock(record_->mutex);
  return record_->ready;
}

std::optional<std::string> ServiceLine::ended() const {
  const std::scoped_lock lock(record_->mutex);
  return record_->ended;
}

std::vector<std::string> ServiceLine::surplusAnswers() const {
  const std::scoped_lock lock(record_->mutex);
  return record_->surplus;
}

}  // namespace spacekeep::ctl
