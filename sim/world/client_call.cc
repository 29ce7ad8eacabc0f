#include <utility>

#include "sim/world/simulated_listener.h"
#include "support/runtime/locks.h"

namespace spacekeep::sim {
namespace {

std::optional<Dictionary> firstDictionary(const ipc::Arguments& arguments) {
  for (const ipc::Argument& argument : arguments) {
    if (const auto* plain = std::get_if<Dictionary>(&argument)) return *plain;
    if (const auto* optional = std::get_if<ipc::OptionalDictionary>(&argument)) return *optional;
  }
  return std::nullopt;
}

std::optional<Value> firstValue(const ipc::Arguments& arguments) {
  for (const ipc::Argument& argument : arguments) {
    if (const auto* value = std::get_if<ipc::OptionalValue>(&argument)) return *value;
  }
  return std::nullopt;
}

}  // namespace

ClientCall::ClientCall(Trace& trace, std::string member)
    : trace_(trace), member_(std::move(member)), number_(trace.nextCall()) {}

ClientCall::State ClientCall::state() const {
  const std::scoped_lock lock(mutex_);
  return state_;
}

ipc::Arguments ClientCall::answer() const {
  const std::scoped_lock lock(mutex_);
  return answer_;
}

std::optional<Dictionary> ClientCall::dictionary() const { return firstDictionary(answer()); }

unsigned ClientCall::answers() const {
  const std::scoped_lock lock(mutex_);
  return answers_;
}

std::string ClientCall::error() const {
  const std::scoped_lock lock(mutex_);
  return error_;
}

std::uint64_t ClientCall::answeredNs() const {
  const std::scoped_lock lock(mutex_);
  return answered_ns_;
}

std::optional<Dictionary> ClientCall::wait() {
  finished_.wait();
  finished_.signal();
  return dictionary();
}

bool ClientCall::waitForNs(std::uint64_t duration_ns) {
  if (finished_.waitForNs(duration_ns) == WaitResult::kTimedOut) return false;
  finished_.signal();
  return true;
}

void ClientCall::reply(ipc::Arguments arguments) {
  const std::scoped_lock lock(mutex_);
  trace_.add(ClientAnswered{number_, member_, firstDictionary(arguments), firstValue(arguments)});
  ++answers_;
  if (state_ != State::kOpen) return;
  answer_ = std::move(arguments);
  finish(State::kAnswered);
}

void ClientCall::fail(const ipc::Error& error) {
  const std::scoped_lock lock(mutex_);
  if (state_ != State::kOpen) return;
  error_ = error.text;
  trace_.add(ClientRefused{number_, member_, error.name + ": " + error.text});
  finish(State::kFailed);
}

void ClientCall::drop() {
  const std::scoped_lock lock(mutex_);
  if (state_ != State::kOpen) return;
  trace_.add(ClientDropped{number_, member_});
  finish(State::kDropped);
}

void ClientCall::finish(State state) {
  state_ = state;
  answered_ns_ = trace_.nowNs();
  finished_.signal();
}

}  // namespace spacekeep::sim
