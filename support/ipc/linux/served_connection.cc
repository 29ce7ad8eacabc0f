#include "support/ipc/linux/served_connection.h"

#include <systemd/sd-bus.h>
#include <systemd/sd-id128.h>

#include <algorithm>
#include <string_view>
#include <utility>

#include "support/ipc/error_names.h"
#include "support/ipc/linux/open_call.h"
#include "support/ipc/linux/wire_reader.h"
#include "support/ipc/linux/wire_text.h"
#include "support/ipc/linux/wire_writer.h"
#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

constexpr std::string_view kIntrospectable = "org.freedesktop.DBus.Introspectable";
constexpr std::string_view kPeer = "org.freedesktop.DBus.Peer";
constexpr std::size_t kMaxErrorText = 2048;

LinkLimits linkLimits(const ServerLimits& limits) {
  return {limits.authentication_ns, limits.message_bytes, limits.queued_messages,
          limits.queued_bytes};
}

std::string textOrEmpty(const char* text) { return text == nullptr ? "" : text; }

struct MessageUnref {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using OwnedMessage = std::unique_ptr<sd_bus_message, MessageUnref>;

/// A call as sd-bus wants to see it to make an answer from: the real one has been let go of, since
/// it may be large, and nothing but its serial matters.
OwnedMessage callOfSerial(sd_bus* bus, std::uint64_t serial) {
  sd_bus_message* call = nullptr;
  if (sd_bus_message_new_method_call(bus, &call, nullptr, kObjectPath, nullptr, "Answered") < 0) {
    return nullptr;
  }
  OwnedMessage owned(call);
  return sd_bus_message_seal(call, serial, 0) < 0 ? nullptr : std::move(owned);
}

/// The node on the way to the object whose path begins with `path` ("/" or "/com", ...), as an
/// introspection document that names the next step; empty when there is none.
std::string documentOfParent(std::string_view path) {
  const std::string_view object(kObjectPath);
  const std::string prefix = path == "/" ? "/" : std::string(path) + "/";
  if (!object.starts_with(prefix)) return "";
  const std::string_view rest = object.substr(prefix.size());
  return "<node>\n  <node name=\"" + std::string(rest.substr(0, rest.find('/'))) +
         "\"/>\n</node>\n";
}

}  // namespace

ServedConnection::ServedConnection(std::shared_ptr<ServerContext> context,
                                   std::shared_ptr<AcceptedPeer> peer, std::function<void()> on_end)
    : context_(std::move(context)),
      peer_(std::move(peer)),
      on_end_(std::move(on_end)),
      link_(context_->loop, *this, Authentication::Role::kServer,
            linkLimits(context_->options.limits)) {}

void ServedConnection::start(int fd) { link_.start(fd, identity().uid()); }

void ServedConnection::linkEnded(LinkEnd end, const std::string& why) {
  if (end == LinkEnd::kRefused) context_->refusals.write(identity().describe(), why);
  if (const auto on_end = std::exchange(on_end_, nullptr)) on_end();
}

bool ServedConnection::linkMayRead() {
  const uid_t uid = identity().uid();
  if (context_->pace.mayGoOn(uid)) return true;
  context_->pace.wait(uid, [weak = weak_from_this()] {
    if (const auto self = weak.lock()) self->link_.resumeReading();
  });
  return false;
}

void ServedConnection::linkMessage(sd_bus_message* message) {
  context_->pace.spendOnMessage(identity().uid(), link_.messageBytes());
  // Answers and signals are of no interest here: nothing is ever asked over this connection.
  if (sd_bus_message_is_method_call(message, nullptr, nullptr) > 0) dispatch(message);
}

void ServedConnection::dispatch(sd_bus_message* call) {
  // The sender that the message names is not looked at: the peer can write anything there.
  const std::string interface = textOrEmpty(sd_bus_message_get_interface(call));
  const std::string member = textOrEmpty(sd_bus_message_get_member(call));
  if (interface == kPeer || interface == kIntrospectable) {
    dispatchStandard(call, interface, member);
    return;
  }
  const std::string path = textOrEmpty(sd_bus_message_get_path(call));
  const std::string name(context_->interface.description->name);
  if (path != kObjectPath) {
    refuse(call, kErrorUnknownObject, "There is no object " + path + "; use " + kObjectPath);
  } else if (!interface.empty() && interface != name) {
    refuse(call, kErrorUnknownInterface, "There is no interface " + interface + "; use " + name);
  } else {
    dispatchServed(call, member);
  }
}

void ServedConnection::dispatchStandard(sd_bus_message* call, const std::string& interface,
                                        const std::string& member) {
  const std::string path = textOrEmpty(sd_bus_message_get_path(call));
  sd_id128_t machine{};
  if (interface == kPeer && member == "Ping") {
    sendEmpty(call);
  } else if (interface == kPeer && member == "GetMachineId" &&
             sd_id128_get_machine(&machine) >= 0) {
    char text[SD_ID128_STRING_MAX];
    sendText(call, sd_id128_to_string(machine, text));
  } else if (interface == kIntrospectable && member == "Introspect") {
    const std::string document = path == kObjectPath
                                     ? introspectionXml(*context_->interface.description)
                                     : documentOfParent(path);
    if (document.empty()) {
      refuse(call, kErrorUnknownObject, "There is no object " + path + "; use " + kObjectPath);
    } else {
      sendText(call, document);
    }
  } else {
    refuse(call, kErrorUnknownMethod, "There is no method " + interface + "." + member);
  }
}

void ServedConnection::dispatchServed(sd_bus_message* call, const std::string& member) {
  const InterfaceDescription& interface = *context_->interface.description;
  const MethodDescription* method = interface.method(member);
  if (method == nullptr) {
    refuse(call, kErrorUnknownMethod,
           "There is no method " + member + " in " + std::string(interface.name));
  } else if (unanswered_ >= context_->options.limits.unanswered_calls) {
    refuse(call, kErrorLimitsExceeded,
           std::to_string(unanswered_) + " calls of this connection are unanswered; wait for them");
  } else {
    serve(call, *method);
  }
}

void ServedConnection::serve(sd_bus_message* call, const MethodDescription& method) {
  WireReader reader(call, context_->endpoint_rules);
  auto arguments = reader.read(method.in);
  if (!arguments) {
    refuse(call, kErrorInvalidArgs, std::string(method.name) + ": " + reader.problem());
    return;
  }
  const auto& methods = context_->interface.methods;
  const auto served =
      std::find_if(methods.begin(), methods.end(),
                   [&method](const auto& candidate) { return candidate.name == method.name; });
  const std::size_t bytes = link_.messageBytes();
  if (served->turn_per_user) {
    if (const std::string why = context_->turns.refusal(identity().uid(), bytes); !why.empty()) {
      refuse(call, kErrorLimitsExceeded, why);
      return;
    }
  }
  std::uint64_t serial = 0;
  if (sd_bus_message_get_cookie(call, &serial) < 0) return;
  ++unanswered_;
  const bool is_long = served->mode == ServeMode::kLane || !served->brief;
  context_->pace.spendOnCall(identity().uid(), is_long);
  auto open = std::make_shared<OpenCall>(
      context_, weak_from_this(), method, serial, sd_bus_message_get_expect_reply(call) > 0,
      served->turn_per_user ? std::optional(identity().uid()) : std::nullopt);
  run(*served, bytes,
      [context = context_, peer = peer_, served = &*served, open = std::move(open),
       arguments = std::move(*arguments)]() mutable {
        const GatePass pass(context->gate);
        if (!pass.inside()) return;
        const ServingScope scope(peer.get());
        served->serve(std::move(arguments), OpenCall::responderFor(std::exchange(open, nullptr)));
      });
}

void ServedConnection::run(const ServedMethod& method, std::size_t bytes, Task task) {
  // Brief or not, by the same way, so that the calls of one connection keep their order.
  auto start = [self = shared_from_this(), served = &method, task = std::move(task)]() mutable {
    self->context_->loop.serveSoon(served->brief ? &self->context_->global : nullptr,
                                   [self, served, task = std::move(task)]() mutable {
                                     self->schedule(*served, std::move(task));
                                   });
  };
  if (method.mode == ServeMode::kLane) return start();
  context_->turns.add(identity().uid(), {method.turn_per_user, bytes, std::move(start)});
}

void ServedConnection::schedule(const ServedMethod& method, Task task) {
  switch (method.mode) {
    case ServeMode::kInOrder:
      if (in_order_ == nullptr) in_order_ = SerialQueue::create("ipc.connection", context_->global);
      in_order_->async(std::move(task));
      return;
    case ServeMode::kLane:
      context_->lanes->run(method.lane, method.lane_width, std::move(task));
      return;
  }
}

void ServedConnection::answer(std::uint64_t serial, const MethodDescription& method,
                              const Arguments& arguments) {
  if (link_.ended()) return;
  const OwnedMessage call = callOfSerial(link_.bus(), serial);
  sd_bus_message* made = nullptr;
  if (call == nullptr || sd_bus_message_new_method_return(call.get(), &made) < 0) return;
  const OwnedMessage message(made);
  WireWriter writer(message.get());
  if (writer.write(method.out, arguments)) {
    link_.send(message.get(), writer.bytes());
    return;
  }
  logProblem("%s The answer to %@ does not fit into a message", "answer", method.name);
  sendError(call.get(), kErrorLimitsExceeded, "The answer does not fit into a message");
}

void ServedConnection::fail(std::uint64_t serial, const Error& error) {
  if (link_.ended()) return;
  const OwnedMessage call = callOfSerial(link_.bus(), serial);
  if (call != nullptr) sendError(call.get(), error.name.c_str(), error.text);
}

void ServedConnection::sendEmpty(sd_bus_message* call) {
  sd_bus_message* made = nullptr;
  if (sd_bus_message_get_expect_reply(call) <= 0) return;
  if (sd_bus_message_new_method_return(call, &made) < 0) return;
  const OwnedMessage message(made);
  link_.send(message.get(), 128);
}

void ServedConnection::sendText(sd_bus_message* call, const std::string& text) {
  sd_bus_message* made = nullptr;
  if (sd_bus_message_get_expect_reply(call) <= 0) return;
  if (sd_bus_message_new_method_return(call, &made) < 0) return;
  const OwnedMessage message(made);
  if (sd_bus_message_append_basic(message.get(), 's', text.c_str()) < 0) return;
  link_.send(message.get(), 128 + text.size());
}

void ServedConnection::refuse(sd_bus_message* call, const char* error_name,
                              const std::string& text) {
  if (sd_bus_message_get_expect_reply(call) > 0) sendError(call, error_name, text);
}

bool ServedConnection::sendError(sd_bus_message* call, const char* error_name,
                                 const std::string& text) {
  const std::string words = wireText(std::string_view(text).substr(0, kMaxErrorText));
  const sd_bus_error error{error_name, words.c_str(), 0};
  sd_bus_message* made = nullptr;
  if (sd_bus_message_new_method_error(call, &made, &error) < 0) return false;
  const OwnedMessage message(made);
  return link_.send(message.get(), 128 + words.size()).has_value();
}

}  // namespace spacekeep::ipc
