// Thread safety: used by one test at a time.
//
// A daemon with clients that keep state in it, and a look at what is on its disk.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "purgeable/recent_archive.h"
#include "tests/both/daemon/daemon_world.h"

namespace spacekeep::test {

inline constexpr const char* kSuite = "com.quorvel.spacekeep";

struct StateWorld : DaemonWorld {
  using Record = std::shared_ptr<SpacekeepRecentInfo>;

  /// What the disk holds before the daemon starts.
  void putOnDisk(Value state) {
    world.disk().write(kSuite, {{keys::kUserDefaults, std::move(state)}});
  }
  [[nodiscard]] std::optional<Value> stateOnDisk() const {
    const auto contents = world.disk().read(kSuite);
    const auto found = contents.find(keys::kUserDefaults);
    return found == contents.end() ? std::nullopt : std::optional(found->second);
  }
  [[nodiscard]] std::optional<Value> onDisk(const std::string& key) const {
    const auto state = stateOnDisk();
    const Dictionary* dictionary = state ? state->dictionary() : nullptr;
    const Value* value = dictionary == nullptr ? nullptr : dictionary->find(key);
    return value == nullptr ? std::nullopt : std::optional(*value);
  }

  /// A client's call, with its end.
  std::shared_ptr<sim::ClientCall> setAsClient(const std::string& key, ipc::OptionalValue value) {
    auto call = world.call(client, "clientSetState", {std::move(value), key});
    call->wait();
    return call;
  }
  /// Answers whether the daemon said that it is stored.
  bool set(const std::string& key, ipc::OptionalValue value) {
    return setAsClient(key, std::move(value))->state() == sim::ClientCall::State::kAnswered;
  }
  std::optional<Value> get(const std::string& key) {
    const auto call = world.call(client, "clientGetState", {key});
    call->wait();
    const auto answer = call->answer();
    EXPECT_EQ(answer.size(), 1U);
    return answer.empty() ? std::nullopt : std::get<ipc::OptionalValue>(answer[0]);
  }

  // The daemon's own forms, on the queue that they belong to.
  void setSync(StateObject value, const std::string& key) {
    daemon->defaults_queue()->sync([&] { daemon->clientSetStateSync(std::move(value), key); });
  }
  StateObject getSync(const std::string& key) {
    StateObject answer;
    daemon->defaults_queue()->sync([&] { answer = daemon->clientGetStateSync(key); });
    return answer;
  }
  /// A copy of the record under `key`, none when there is none.
  std::optional<SpacekeepRecentInfo> recordAt(const std::string& key) {
    std::optional<SpacekeepRecentInfo> copy;
    daemon->defaults_queue()->sync([&] {
      const StateObject stored = daemon->clientGetStateSync(key);
      const auto* record = std::get_if<Record>(&stored);
      if (record != nullptr && *record != nullptr) copy = **record;
    });
    return copy;
  }
  std::optional<SpacekeepRecentInfo> record() { return recordAt(keys::kRecentServiceStats); }

  /// The texts of the problems since the world began.
  [[nodiscard]] std::vector<std::string> problems() const {
    return world.trace().linesOfLevel(kLogProblem);
  }
  [[nodiscard]] std::vector<std::string> traces() const {
    return world.trace().linesOfLevel(kLogTrace);
  }

  std::shared_ptr<sim::SimulatedPeer> client = world.client("keeper");
};

/// A record of one volume where `service_id` said `amount` just now.
inline SpacekeepRecentInfo recordOf(const std::string& volume, const std::string& service_id,
                                    Value amount) {
  SpacekeepRecentInfo record;
  record.update(volume, service_id,
                {.amount = std::move(amount), .timestamp = recentDate(rt::wallClockNs())}, 0);
  return record;
}

inline std::shared_ptr<SpacekeepRecentInfo> shared(SpacekeepRecentInfo record) {
  return std::make_shared<SpacekeepRecentInfo>(std::move(record));
}

}  // namespace spacekeep::test
