#include "registry/service_protocol.h"

#include <utility>

namespace spacekeep {
namespace {

using ipc::ArgumentKind;

std::vector<ipc::ArgumentDescription> urgencyAndInfo() {
  return {{"urgency", ArgumentKind::kInt32}, {"info", ArgumentKind::kDictionary}};
}

std::vector<ipc::ArgumentDescription> optionalReply() {
  return {{"reply", ArgumentKind::kOptionalDictionary}};
}

ipc::RemoteProxy::ReplyHandler takingDictionary(SpacekeepServiceProtocol::DictionaryReply reply) {
  return [reply = std::move(reply)](ipc::Arguments out) {
    ipc::OptionalDictionary answer;
    if (!out.empty()) {
      if (auto* dictionary = std::get_if<ipc::OptionalDictionary>(&out.front())) {
        answer = std::move(*dictionary);
      }
    }
    reply(std::move(answer));
  };
}

ipc::RemoteProxy::ReplyHandler takingNothing(SpacekeepServiceProtocol::EmptyReply reply) {
  return [reply = std::move(reply)](const ipc::Arguments&) { reply(); };
}

}  // namespace

const ipc::InterfaceDescription& spacekeepServiceInterface() {
  static const ipc::InterfaceDescription interface {
    "com.quorvel.SpacekeepServiceProtocol", {
      {"servicePurgeable", urgencyAndInfo(), optionalReply()},
          {"servicePurge", urgencyAndInfo(), optionalReply()},
          {"servicePeriodic", urgencyAndInfo(), optionalReply()}, {"serviceCancelPurge", {}, {}},
          {"servicePing", {}, {}},
          {"serviceNotify", {{"notification", ArgumentKind::kDictionary}}, {}},
          {"serviceCallback", {{"info", ArgumentKind::kDictionary}}, optionalReply()},
    }
  };
  return interface;
}

void SpacekeepServiceProtocol::servicePurgeable(std::int32_t urgency, Dictionary info,
                                                DictionaryReply reply) const {
  proxy_->call("servicePurgeable", {urgency, std::move(info)}, takingDictionary(std::move(reply)));
}

void SpacekeepServiceProtocol::servicePurge(std::int32_t urgency, Dictionary info,
                                            DictionaryReply reply) const {
  proxy_->call("servicePurge", {urgency, std::move(info)}, takingDictionary(std::move(reply)));
}

void SpacekeepServiceProtocol::servicePeriodic(std::int32_t urgency, Dictionary info,
                                               DictionaryReply reply) const {
  proxy_->call("servicePeriodic", {urgency, std::move(info)}, takingDictionary(std::move(reply)));
}

void SpacekeepServiceProtocol::serviceCancelPurge(EmptyReply reply) const {
  proxy_->call("serviceCancelPurge", {}, takingNothing(std::move(reply)));
}

void SpacekeepServiceProtocol::servicePing(EmptyReply reply) const {
  proxy_->call("servicePing", {}, takingNothing(std::move(reply)));
}

void SpacekeepServiceProtocol::serviceNotify(Dictionary notification, EmptyReply reply) const {
  proxy_->call("serviceNotify", {std::move(notification)}, takingNothing(std::move(reply)));
}

void SpacekeepServiceProtocol::serviceCallback(Dictionary info, DictionaryReply reply) const {
  proxy_->call("serviceCallback", {std::move(info)}, takingDictionary(std::move(reply)));
}

}  // namespace spacekeep
