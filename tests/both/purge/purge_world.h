// Thread safety: used by one test at a time; answers() may be called from any thread.
//
// A world for purge operations alone, without a daemon around them.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "operations/info_keys.h"
#include "purge/purge_operation.h"
#include "sim/world/world.h"
#include "support/runtime/guarded.h"
#include "support/timebase.h"

namespace spacekeep::test {

/// Schedules per test; on real threads it is far fewer.
inline constexpr unsigned kSchedules = 50;
/// On real threads this is a few seconds, which a busy machine may need.
inline constexpr std::uint64_t kPatienceNs = 3'600'000'000'000;

/// Lets a test reach what only operations themselves may set.
class OpenPurgeOperation : public SpacekeepPurgeOperation {
 public:
  using SpacekeepOperation::setUrgencyLimit;
  using SpacekeepPurgeOperation::SpacekeepPurgeOperation;
};

struct PurgeWorld {
  PurgeWorld() {
    const rt::Timebase timebase = *rt::timebase();
    gTimebaseConversion = static_cast<double>(timebase.numerator) / timebase.denominator;
    world.volumes().add("/", 1'000'000'000, 0);
  }
  ~PurgeWorld() { world.shutDown(); }
  PurgeWorld(const PurgeWorld&) = delete;
  PurgeWorld& operator=(const PurgeWorld&) = delete;

  /// A service that can be reached, with its record in the snapshot.
  std::shared_ptr<sim::SimulatedService> add(const std::string& service_id,
                                             sim::ServiceBehaviour behaviour,
                                             bool does_purge = true) {
    auto service = world.addService(service_id, std::move(behaviour));
    world.connector().declare(service);
    auto record = std::make_shared<SKService>(service_id);
    record->setDoesPurge(does_purge);
    services[service_id] = record;
    return service;
  }

  std::shared_ptr<OpenPurgeOperation> make(Dictionary request) {
    request.set(keys::kVolume, "/");
    return makeOperation<OpenPurgeOperation>(platform, std::move(request), services);
  }

  /// Runs it to its end and answers the outcome: what the completion got last before the end.
  Dictionary run(OpenPurgeOperation& operation) {
    operation.startOperation(completion());
    return answers().back();
  }

  Dictionary purge(Dictionary request) {
    const auto operation = make(std::move(request));
    return run(*operation);
  }

  OperationCompletion completion() {
    return [seen = seen_](const Dictionary& answer) {
      seen->update([&](std::vector<Dictionary>& list) { list.push_back(answer); });
    };
  }
  [[nodiscard]] std::vector<Dictionary> answers() const { return seen_->get(); }

  [[nodiscard]] std::size_t lines(std::string_view format) const {
    return world.trace().linesWithFormat(format).size();
  }

  [[nodiscard]] bool eventually(const std::function<bool()>& condition) {
    return world.eventually(condition, kPatienceNs);
  }

  mutable sim::World world;
  Platform& platform = world.platform();
  ServiceMap services;

 private:
  std::shared_ptr<rt::Guarded<std::vector<Dictionary>>> seen_ =
      std::make_shared<rt::Guarded<std::vector<Dictionary>>>();
};

inline constexpr std::uint64_t kMs = 1'000'000;
inline constexpr std::uint64_t kSecond = 1'000'000'000;

/// Owns `bytes` and answers every purge call `delay_ns` after it came.
inline sim::ServiceBehaviour ownsAndAnswersAfter(std::uint64_t bytes, std::uint64_t delay_ns) {
  sim::ServiceBehaviour behaviour = sim::ownsBytes("/", bytes);
  behaviour.purge = {sim::CallBehaviour{.delay_ns = delay_ns}};
  return behaviour;
}

/// Answers every purge call as `answer` says and owns nothing.
inline sim::ServiceBehaviour answers(sim::Answer answer) {
  sim::ServiceBehaviour behaviour;
  behaviour.purge = {sim::CallBehaviour{.answer = answer}};
  return behaviour;
}

/// The dictionary under `key`, empty when there is none.
inline Dictionary dictionaryAt(const Dictionary& outer, const std::string& key) {
  const Value* value = outer.find(key);
  const Dictionary* inner = value ? value->dictionary() : nullptr;
  return inner ? *inner : Dictionary();
}

}  // namespace spacekeep::test
