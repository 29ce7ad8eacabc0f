#include "support/ipc/linux/call_server.h"

#include <systemd/sd-bus.h>
#include <systemd/sd-id128.h>

#include <algorithm>
#include <string_view>
#include <utility>

#include "support/ipc/error_names.h"
#include "support/ipc/linux/open_call.h"
#include "support/ipc/linux/owned_message.h"
#include "support/ipc/linux/wire_reader.h"
#include "support/ipc/linux/wire_writer.h"
#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

constexpr std::string_view kIntrospectable = "org.freedesktop.DBus.Introspectable";
constexpr std::string_view kPeer = "org.freedesktop.DBus.Peer";

/// A descriptor that waits counts as that many bytes: a process has fewer of them than bytes.
constexpr std::size_t kDescriptorWeight = 16 * 1024;

std::string textOrEmpty(const char* text) { return text == nullptr ? "" : text; }

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

void CallServer::dispatch(sd_bus_message* call, std::size_t bytes) {
  // The sender that the message names is not looked at: the peer can write anything there.
  const std::string interface = textOrEmpty(sd_bus_message_get_interface(call));
  const std::string member = textOrEmpty(sd_bus_message_get_member(call));
  if (interface == kPeer || interface == kIntrospectable) {
    dispatchStandard(call, interface, member);
    return;
  }
  const std::string path = textOrEmpty(sd_bus_message_get_path(call));
  const InterfaceDescription& first = *context_->interface.description;
  // Without a name, the interface is the one that has the method.
  const auto* meant = interface.empty() ? first.having(member) : first.named(interface);
  if (path != kObjectPath) {
    refuse(call, kErrorUnknownObject, "There is no object " + path + "; use " + kObjectPath);
  } else if (meant == nullptr && !interface.empty()) {
    refuse(call, kErrorUnknownInterface,
           "There is no interface " + interface + "; use " + std::string(first.name));
  } else {
    dispatchServed(call, meant == nullptr ? first : *meant, member, bytes);
  }
}

void CallServer::dispatchStandard(sd_bus_message* call, const std::string& interface,
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

void CallServer::dispatchServed(sd_bus_message* call, const InterfaceDescription& interface,
                                const std::string& member, std::size_t bytes) {
  const MethodDescription* method = interface.method(member);
  if (method == nullptr) {
    refuse(call, kErrorUnknownMethod,
           "There is no method " + member + " in " + std::string(interface.name));
  } else if (unanswered_ >= context_->options.limits.unanswered_calls) {
    refuse(call, kErrorLimitsExceeded,
           std::to_string(unanswered_) + " calls of this connection are unanswered; wait for them");
  } else if (const std::string problem = methodProblem(*method); !problem.empty()) {
    refuse(call, kErrorNotSupported, problem);
  } else {
    serve(call, *method, bytes);
  }
}

void CallServer::serve(sd_bus_message* call, const MethodDescription& method, std::size_t bytes) {
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
  std::string why;
  auto room = roomFor(*served, method, bytes, why);
  if (!why.empty()) {
    refuse(call, kErrorLimitsExceeded, why);
    return;
  }
  std::uint64_t serial = 0;
  if (sd_bus_message_get_cookie(call, &serial) < 0) return;
  ++unanswered_;
  const bool is_long = served->mode == ServeMode::kLane || !served->brief;
  context_->pace.spendOnCall(identity().uid(), is_long);
  auto open = std::make_shared<OpenCall>(
      context_, weak_from_this(), method, serial, sd_bus_message_get_expect_reply(call) > 0,
      served->turn_per_user ? std::optional(identity().uid()) : std::nullopt, std::move(room));
  run(*served, bytes,
      [context = context_, peer = peer_, served = &*served, open = std::move(open),
       arguments = std::move(*arguments)]() mutable {
        const GatePass pass(context->gate);
        if (!pass.inside()) return;
        const ServingScope scope(peer.get());
        served->serve(std::move(arguments), OpenCall::responderFor(std::exchange(open, nullptr)));
      });
}

/// Calls that wait in a lane, or with a descriptor for whoever serves them, outlive the connection
/// over which they came. Others are few at a time by their turn.
std::shared_ptr<void> CallServer::roomFor(const ServedMethod& served,
                                          const MethodDescription& method, std::size_t bytes,
                                          std::string& why) {
  const bool is_in_lane = served.mode == ServeMode::kLane;
  if (!is_in_lane) why = context_->turns.refusal(identity().uid(), bytes);
  const bool brings_descriptor = passesDescriptor(method);
  if (!why.empty() || !(is_in_lane || brings_descriptor)) return nullptr;
  const std::size_t weight = bytes + (brings_descriptor ? kDescriptorWeight : 0);
  return context_->lane_budget->take(identity().uid(), weight, why);
}

void CallServer::run(const ServedMethod& method, std::size_t bytes, Task task) {
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

void CallServer::schedule(const ServedMethod& method, Task task) {
  switch (method.mode) {
    case ServeMode::kInOrder:
      if (in_order_ == nullptr)
        in_order_ = SerialQueue::create("com.quorvel.spacekeep_ipc_connection", context_->global);
      in_order_->async(std::move(task));
      return;
    case ServeMode::kLane:
      context_->lanes->run(method.lane, method.lane_width, std::move(task));
      return;
  }
}

void CallServer::answer(std::uint64_t serial, const MethodDescription& method,
                        const Arguments& arguments) {
  if (bus() == nullptr) return;
  const OwnedMessage call = callOfSerial(bus(), serial, destination());
  sd_bus_message* made = nullptr;
  if (call == nullptr || sd_bus_message_new_method_return(call.get(), &made) < 0) return;
  const OwnedMessage message(made);
  WireWriter writer(message.get());
  if (writer.write(method.out, arguments)) {
    std::string problem = sizeProblem(writer.bytes());
    if (problem.empty()) problem = answerProblem(writer.bytes());
    if (problem.empty()) return send(message.get(), writer.bytes());
    context_->refused_calls.write(identity().describe(), problem, method.name);
    return sendError(call.get(), kErrorLimitsExceeded, problem);
  }
  logProblem("%s The answer to %@ does not fit into a message", "answer", method.name);
  sendError(call.get(), kErrorLimitsExceeded, "The answer does not fit into a message");
}

std::string CallServer::sizeProblem(std::size_t bytes) const {
  const std::size_t most = context_->options.limits.message_bytes;
  if (bytes <= most) return "";
  return "The answer has " + std::to_string(bytes) + " bytes, and a message " +
         std::to_string(most) + " at most";
}

void CallServer::fail(std::uint64_t serial, const Error& error) {
  if (bus() == nullptr) return;
  const OwnedMessage call = callOfSerial(bus(), serial, destination());
  if (call != nullptr) sendError(call.get(), error.name.c_str(), error.text);
}

void CallServer::sendEmpty(sd_bus_message* call) {
  sd_bus_message* made = nullptr;
  if (sd_bus_message_get_expect_reply(call) <= 0) return;
  if (sd_bus_message_new_method_return(call, &made) < 0) return;
  const OwnedMessage message(made);
  send(message.get(), 128);
}

void CallServer::sendText(sd_bus_message* call, const std::string& text) {
  sd_bus_message* made = nullptr;
  if (sd_bus_message_get_expect_reply(call) <= 0) return;
  if (sd_bus_message_new_method_return(call, &made) < 0) return;
  const OwnedMessage message(made);
  if (sd_bus_message_append_basic(message.get(), 's', text.c_str()) < 0) return;
  send(message.get(), 128 + text.size());
}

void CallServer::refuse(sd_bus_message* call, const char* error_name, const std::string& text) {
  context_->refused_calls.write(identity().describe(), text,
                                textOrEmpty(sd_bus_message_get_member(call)));
  if (sd_bus_message_get_expect_reply(call) > 0) sendError(call, error_name, text);
}

void CallServer::sendError(sd_bus_message* call, const char* error_name, const std::string& text) {
  const OwnedMessage message = errorAnswer(call, error_name, text);
  if (message != nullptr) send(message.get(), errorAnswerBytes(text));
}

}  // namespace spacekeep::ipc
