#include "client/history_protocol.h"

#include <utility>

#include "client/client_protocol.h"

namespace spacekeep {
namespace {

/// The name of the error that answers when there is no history to be read.
constexpr const char* kNoHistoryError = "com.quorvel.Spacekeep.Error.NoHistory";

void serve(const std::weak_ptr<SpacekeepHistoryProtocol>& weak, ipc::Arguments in,
           const ipc::Responder& responder) {
  const auto exported = weak.lock();
  if (!exported) {
    responder.fail({"org.freedesktop.DBus.Error.UnknownObject", "the daemon object is gone"});
    return;
  }
  if (!ipc::matches(spacekeepHistoryInterface().methods.front().in, in)) {
    responder.fail({"org.freedesktop.DBus.Error.InvalidArgs",
                    "clientHistory: arguments do not match the signature"});
    return;
  }
  exported->clientHistory(
      std::get<Dictionary>(std::move(in[0])),
      [responder](ipc::OptionalDictionary result) {
        ipc::Arguments answer;
        answer.emplace_back(std::move(result));
        responder.reply(std::move(answer));
      },
      [responder](std::string why) {
        responder.fail({kNoHistoryError, std::move(why)});
      });
}

}  // namespace

const ipc::InterfaceDescription& spacekeepHistoryInterface() {
  using Kind = ipc::ArgumentKind;
  static const ipc::InterfaceDescription interface = {
      "com.quorvel.SpacekeepHistoryProtocol",
      {{"clientHistory", {{"info", Kind::kDictionary}}, {{"result", Kind::kOptionalDictionary}}}}};
  return interface;
}

const ipc::InterfaceDescription& spacekeepClientInterfaces() {
  static const ipc::InterfaceDescription interfaces = [] {
    ipc::InterfaceDescription both = spacekeepClientInterface();
    both.beside = &spacekeepHistoryInterface();
    return both;
  }();
  return interfaces;
}

// It may wait for the disk, so it is not brief; it goes through one queue, so a user has a turn.
void serveHistory(ipc::ServedInterface& served, std::weak_ptr<SpacekeepHistoryProtocol> exported) {
  served.description = &spacekeepClientInterfaces();
  served.methods.push_back(
      {.name = "clientHistory",
       .mode = ipc::ServeMode::kInOrder,
       .lane = "",
       .turn_per_user = true,
       .serve = [exported = std::move(exported)](ipc::Arguments in, ipc::Responder responder) {
         serve(exported, std::move(in), responder);
       }});
}

}  // namespace spacekeep
