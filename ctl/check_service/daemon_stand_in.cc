#include "ctl/check_service/daemon_stand_in.h"

#include <unistd.h>

#include "client/client_protocol.h"
#include "support/access/peer_identity.h"
#include "support/ipc/linux/sockets.h"

namespace spacekeep::ctl {
namespace {

/// The answer that a member of the client interface gets here: "no" in its own form.
ipc::Arguments refusalOf(const ipc::MethodDescription& method) {
  ipc::Arguments out;
  for (const auto& argument : method.out) {
    if (argument.kind == ipc::ArgumentKind::kOptionalDictionary) {
      out.emplace_back(ipc::OptionalDictionary());
    } else if (argument.kind == ipc::ArgumentKind::kOptionalValue) {
      out.emplace_back(ipc::OptionalValue());
    } else {
      out.emplace_back(ipc::OptionalString());
    }
  }
  return out;
}

/// Root checks services that run under other users; everybody else only their own.
bool admits(ipc::PeerConnection& peer, std::string& why) {
  const uid_t own = geteuid();
  if (own == 0 || peer.identity().uid() == own) return true;
  why = "it belongs to another user";
  return false;
}

}  // namespace

std::string DaemonStandIn::open() {
  std::string why;
  const auto listening = ipc::bindListeningSocket(socket_path_, 0666, why);
  if (listening == nullptr) return why;
  ipc::ServerOptions options;
  options.admit = admits;
  server_ = std::make_unique<ipc::BusServer>(engine_.loop, engine_.queue, interface(), options);
  server_->serveListening(listening);
  return "";
}

void DaemonStandIn::close() {
  if (server_ == nullptr) return;
  unlink(socket_path_.c_str());
  server_.reset();
  waiting_.set({});
}

std::optional<CheckIn> DaemonStandIn::takeCheckIn() {
  std::optional<CheckIn> oldest;
  waiting_.update([&](auto& waiting) {
    if (waiting.empty()) return;
    oldest = std::move(waiting.front());
    waiting.erase(waiting.begin());
  });
  return oldest;
}

void DaemonStandIn::welcome(const CheckIn& check_in) {
  check_in.responder.reply(
      {ipc::OptionalDictionary(Dictionary{{"SPACEKEEP_ID", check_in.id}, {"ANON", true}}),
       ipc::OptionalString()});
}

void DaemonStandIn::noteCheckIn(ipc::Arguments in, ipc::Responder responder) {
  CheckIn check_in{.id = std::get<std::string>(in.at(0)),
                   .endpoint = std::get<ipc::SharedDescriptor>(in.at(1)),
                   .info = std::get<Dictionary>(in.at(2)),
                   .pid = ipc::currentConnection()->identity().pid(),
                   .responder = std::move(responder)};
  waiting_.update([&](auto& waiting) { waiting.push_back(std::move(check_in)); });
}

ipc::ServedInterface DaemonStandIn::interface() {
  ipc::ServedInterface served{&spacekeepClientInterface(), {}};
  for (const auto& method : spacekeepClientInterface().methods) {
    const bool checks_in = method.name == "clientCheckin";
    served.methods.push_back(
        {.name = method.name,
         .mode = ipc::ServeMode::kInOrder,
         .lane = {},
         .lane_width = 1,
         .serve = [this, checks_in, &method](ipc::Arguments in, ipc::Responder responder) {
           if (checks_in) {
             noteCheckIn(std::move(in), std::move(responder));
           } else {
             responder.reply(refusalOf(method));
           }
         }});
  }
  return served;
}

}  // namespace spacekeep::ctl
