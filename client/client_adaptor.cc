#include "client/client_adaptor.h"

#include <string_view>
#include <utility>

namespace spacekeep {
namespace {

using ipc::Arguments;
using ipc::Responder;
using ipc::ServeMode;

/// The name of the error that answers a state change which is not on the disk.
constexpr const char* kNotStoredError = "com.quorvel.Spacekeep.Error.NotStored";

constexpr std::size_t kPurgeLaneWidth = 64;
constexpr std::size_t kQueryLaneWidth = 64;
constexpr std::size_t kCancelLaneWidth = 16;

// Each operation: the decoded arguments in, one call, the reply encoded.

SpacekeepClientProtocol::DictionaryReply takingDictionary(Responder responder) {
  return [responder = std::move(responder)](ipc::OptionalDictionary result) {
    Arguments answer;  // a list in braces would copy what may be thousands of entries
    answer.emplace_back(std::move(result));
    responder.reply(std::move(answer));
  };
}

SpacekeepClientProtocol::EmptyReply takingNothing(Responder responder) {
  return [responder = std::move(responder)] { responder.reply({}); };
}

void checkin(SpacekeepClientProtocol& exported, Arguments in, Responder responder) {
  exported.clientCheckin(std::get<std::string>(std::move(in[0])),
                         std::get<ipc::SharedDescriptor>(std::move(in[1])),
                         std::get<Dictionary>(std::move(in[2])),
                         [responder = std::move(responder)](ipc::OptionalDictionary result,
                                                            ipc::OptionalString error) {
                           responder.reply({std::move(result), std::move(error)});
                         });
}

void purge(SpacekeepClientProtocol& exported, Arguments in, Responder responder) {
  exported.clientPurge(std::get<Dictionary>(std::move(in[0])),
                       takingDictionary(std::move(responder)));
}

void cancelPurge(SpacekeepClientProtocol& exported, Arguments in, Responder responder) {
  exported.clientCancelPurge(std::get<Dictionary>(std::move(in[0])),
                             takingNothing(std::move(responder)));
}

void purgeableSpace(SpacekeepClientProtocol& exported, Arguments in, Responder responder) {
  exported.clientPurgeableSpace(std::get<Dictionary>(std::move(in[0])),
                                takingDictionary(std::move(responder)));
}

void itemizedPurgeableSpace(SpacekeepClientProtocol& exported, Arguments in, Responder responder) {
  exported.clientItemizedPurgeableSpace(std::get<Dictionary>(std::move(in[0])),
                                        takingDictionary(std::move(responder)));
}

void setState(SpacekeepClientProtocol& exported, Arguments in, Responder responder) {
  exported.clientSetState(std::get<ipc::OptionalValue>(std::move(in[0])),
                          std::get<std::string>(std::move(in[1])), takingNothing(responder),
                          [responder](std::string why) {
                            responder.fail({kNotStoredError, std::move(why)});
                          });
}

void getState(SpacekeepClientProtocol& exported, Arguments in, Responder responder) {
  exported.clientGetState(std::get<std::string>(std::move(in[0])),
                          [responder = std::move(responder)](ipc::OptionalValue value) {
                            responder.reply({std::move(value)});
                          });
}

using Serve = void (*)(SpacekeepClientProtocol&, Arguments, Responder);

struct Route {
  std::string_view member;
  ServeMode mode;
  std::string_view lane;
  std::size_t lane_width;
  bool brief;
  bool turn_per_user;
  Serve serve;
};

constexpr Route kRoutes[] = {
    {"clientCheckin", ServeMode::kInOrder, "", 1, false, false, checkin},
    {"clientPurgeableSpace", ServeMode::kLane, "query", kQueryLaneWidth, false, false,
     purgeableSpace},
    {"clientItemizedPurgeableSpace", ServeMode::kLane, "query", kQueryLaneWidth, false, false,
     itemizedPurgeableSpace},
    {"clientPurge", ServeMode::kLane, "purge", kPurgeLaneWidth, false, false, purge},
    {"clientCancelPurge", ServeMode::kLane, "cancel", kCancelLaneWidth, true, false, cancelPurge},
    // Not brief: each one waits for the disk, and the thread that reads the messages would have to be
    // replaced each time.
    {"clientSetState", ServeMode::kInOrder, "", 1, false, true, setState},
    {"clientGetState", ServeMode::kInOrder, "", 1, true, true, getState},
};

void serveCall(const Route& route, const std::weak_ptr<SpacekeepClientProtocol>& weak, Arguments in,
               Responder responder) {
  const auto exported = weak.lock();
  if (!exported) {
    responder.fail({"org.freedesktop.DBus.Error.UnknownObject", "the daemon object is gone"});
    return;
  }
  const auto* method = spacekeepClientInterface().method(route.member);
  if (!ipc::matches(method->in, in)) {
    responder.fail({"org.freedesktop.DBus.Error.InvalidArgs",
                    std::string(route.member) + ": arguments do not match the signature"});
    return;
  }
  route.serve(*exported, std::move(in), std::move(responder));
}

}  // namespace

ipc::ServedInterface makeClientAdaptor(std::weak_ptr<SpacekeepClientProtocol> exported) {
  ipc::ServedInterface served{.description = &spacekeepClientInterface(), .methods = {}};
  for (const Route& route : kRoutes) {
    served.methods.push_back({.name = route.member,
                              .mode = route.mode,
                              .lane = route.lane,
                              .lane_width = route.lane_width,
                              .brief = route.brief,
                              .turn_per_user = route.turn_per_user,
                              .serve = [&route, exported](Arguments in, Responder responder) {
                                serveCall(route, exported, std::move(in), std::move(responder));
                              }});
  }
  return served;
}

}  // namespace spacekeep
