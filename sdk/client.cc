#include <spacekeep/client.h>

#include <memory>
#include <utility>

#include "sdk/client_link.h"
#include "support/queues/waiting.h"

namespace spacekeep::sdk {
namespace {

const char* memberOf(Operation operation) {
  switch (operation) {
    case Operation::kPurge:
      return "clientPurge";
    case Operation::kPurgeableSpace:
      return "clientPurgeableSpace";
    case Operation::kItemizedPurgeableSpace:
      return "clientItemizedPurgeableSpace";
  }
  return "";
}

Reply replyOf(ClientLink::End end) {
  if (auto* error = std::get_if<Error>(&end)) return {std::nullopt, std::move(*error)};
  auto& out = std::get<ipc::Arguments>(end);
  return {std::get<ipc::OptionalDictionary>(std::move(out.at(0))), std::nullopt};
}

Status statusOf(ClientLink::End end) {
  if (auto* error = std::get_if<Error>(&end)) return {std::move(*error)};
  return {};
}

StateReply stateReplyOf(ClientLink::End end) {
  if (auto* error = std::get_if<Error>(&end)) return {std::nullopt, std::move(*error)};
  auto& out = std::get<ipc::Arguments>(end);
  return {std::get<ipc::OptionalValue>(std::move(out.at(0))), std::nullopt};
}

/// Makes one blocking call out of one with a handler.
template <class Answer, class Start>
Answer waitFor(const Start& start) {
  struct Slot {
    CountingSemaphore filled{0};
    std::optional<Answer> answer;
  };
  const auto slot = std::make_shared<Slot>();
  start([slot](Answer answer) {
    slot->answer = std::move(answer);
    slot->filled.signal();
  });
  slot->filled.wait();
  return std::move(*slot->answer);
}

}  // namespace

Dictionary PurgeRequest::info() const {
  Dictionary info{{"SPACEKEEP_VOLUME", volume}, {"SPACEKEEP_AMOUNT", amount}};
  if (urgency) info.set("SPACEKEEP_URGENCY", *urgency);
  if (timeout_seconds) info.set("SPACEKEEP_PURGE_TIMEOUT", *timeout_seconds);
  if (token) info.set("SPACEKEEP_TOKEN", *token);
  if (finish_early) info.set("SPACEKEEP_FINISH_EARLY", *finish_early);
  return info;
}

Dictionary HistoryRequest::info() const {
  Dictionary info;
  if (before) info.set("SPACEKEEP_BEFORE", *before);
  if (limit) info.set("SPACEKEEP_LIMIT", *limit);
  if (volume) info.set("SPACEKEEP_VOLUME", *volume);
  return info;
}

class Client::Impl {
 public:
  explicit Impl(std::unique_ptr<ClientLink> opened) : link(std::move(opened)) {}
  const std::unique_ptr<ClientLink> link;
};

Client::Client(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
Client::Client(Client&&) noexcept = default;
Client& Client::operator=(Client&&) noexcept = default;
Client::~Client() = default;

Result<Client> Client::connect(ClientOptions options) {
  auto link = ClientLink::open(std::move(options));
  if (!link) return link.error();
  return Client(std::make_unique<Impl>(std::move(*link)));
}

bool Client::connected() const { return impl_->link->connected(); }

void Client::callAsync(Operation operation, const Dictionary& info, ReplyHandler handler,
                       Deadline deadline) {
  impl_->link->call(
      memberOf(operation), {info}, deadline,
      [handler = std::move(handler)](ClientLink::End end) { handler(replyOf(std::move(end))); });
}

void Client::purgeAsync(const PurgeRequest& request, ReplyHandler handler, Deadline deadline) {
  callAsync(Operation::kPurge, request.info(), std::move(handler), deadline);
}

void Client::cancelAsync(const Value& token, StatusHandler handler, Deadline deadline) {
  impl_->link->call(
      "clientCancelPurge", {Dictionary{{"SPACEKEEP_TOKEN", token}}}, deadline,
      [handler = std::move(handler)](ClientLink::End end) { handler(statusOf(std::move(end))); });
}

void Client::setStateAsync(const std::string& key, std::optional<Value> value,
                           StatusHandler handler, Deadline deadline) {
  impl_->link->call(
      "clientSetState", {std::move(value), key}, deadline,
      [handler = std::move(handler)](ClientLink::End end) { handler(statusOf(std::move(end))); });
}

void Client::stateAsync(const std::string& key, StateHandler handler, Deadline deadline) {
  impl_->link->call("clientGetState", {key}, deadline,
                    [handler = std::move(handler)](ClientLink::End end) {
                      handler(stateReplyOf(std::move(end)));
                    });
}

void Client::historyAsync(const HistoryRequest& request, ReplyHandler handler, Deadline deadline) {
  impl_->link->call(
      "clientHistory", {request.info()}, deadline,
      [handler = std::move(handler)](ClientLink::End end) { handler(replyOf(std::move(end))); });
}

Reply Client::history(const HistoryRequest& request, Deadline deadline) {
  return waitFor<Reply>(
      [&](ReplyHandler handler) { historyAsync(request, std::move(handler), deadline); });
}

Reply Client::call(Operation operation, const Dictionary& info, Deadline deadline) {
  return waitFor<Reply>(
      [&](ReplyHandler handler) { callAsync(operation, info, std::move(handler), deadline); });
}

Reply Client::purge(const PurgeRequest& request, Deadline deadline) {
  return call(Operation::kPurge, request.info(), deadline);
}

Reply Client::purgeableSpace(const Dictionary& info, Deadline deadline) {
  return call(Operation::kPurgeableSpace, info, deadline);
}

Reply Client::itemizedPurgeableSpace(const Dictionary& info, Deadline deadline) {
  return call(Operation::kItemizedPurgeableSpace, info, deadline);
}

Status Client::cancel(const Value& token, Deadline deadline) {
  return waitFor<Status>(
      [&](StatusHandler handler) { cancelAsync(token, std::move(handler), deadline); });
}

Status Client::setState(const std::string& key, std::optional<Value> value, Deadline deadline) {
  return waitFor<Status>([&](StatusHandler handler) {
    setStateAsync(key, std::move(value), std::move(handler), deadline);
  });
}

StateReply Client::state(const std::string& key, Deadline deadline) {
  return waitFor<StateReply>(
      [&](StateHandler handler) { stateAsync(key, std::move(handler), deadline); });
}

}  // namespace spacekeep::sdk
