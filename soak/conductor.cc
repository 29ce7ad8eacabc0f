// Plays the soak inside the sandbox: starts everything, goes through the phases, takes samples, and
// reports. Usage: soak-conductor MINUTES
#include <fmt/format.h>

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <fstream>
#include <utility>
#include <vector>

#include "soak/plan.h"
#include "soak/processes.h"
#include "soak/report.h"
#include "soak/samples.h"
#include "soak/world.h"

namespace soak {
namespace {

constexpr double kLookSeconds = 0.5;
constexpr double kSampleSeconds = 5;
constexpr double kProgressSeconds = 30;
constexpr double kMostSecondsWithoutAnswer = 120;

class Conductor {
 public:
  explicit Conductor(double minutes) : plan_(planOf(minutes)) {}

  int play() {
    world_.startPeers();
    begin_seconds_ = monotonicSeconds();
    for (const Step& step : plan_) {
      const double step_begin_seconds = monotonicSeconds();
      begin(step);
      while (monotonicSeconds() < step_begin_seconds + step.seconds && !stands()) look(step);
      periods_.push_back({step.phase, step_begin_seconds, monotonicSeconds()});
      if (stands()) break;
    }
    world_.waitForClients();
    writeSamples();
    return report();
  }

 private:
  void begin(const Step& step) {
    switch (step.phase) {
      case Phase::kUnloaded:
      case Phase::kLoaded:
        return;
      case Phase::kComingUp:
        world_.startServices();
        clients_begin_seconds_ = last_answer_seconds_ = monotonicSeconds();
        return world_.startClients(secondsAfter(Phase::kComingUp));
      case Phase::kFlooded:
        return world_.startFlood(kSocket, "everything", step.seconds);
      case Phase::kBareFlooded:
        return world_.startFlood(kFloodedPeer, "calls", step.seconds);
    }
  }

  [[nodiscard]] double secondsAfter(Phase phase) const {
    double seconds = 0;
    for (const Step& step : plan_) {
      seconds = step.phase == phase ? 0 : seconds + step.seconds;
    }
    return seconds;
  }

  /// Whoever waits for the daemon for good would otherwise only be noticed at the end.
  bool stands() {
    if (stands_ || clients_begin_seconds_ == 0) return stands_;
    const long answers = World::answersOfClients();
    const double now = monotonicSeconds();
    if (std::exchange(last_answers_, answers) != answers) last_answer_seconds_ = now;
    stands_ = now >= last_answer_seconds_ + kMostSecondsWithoutAnswer;
    if (stands_) {
      world_.addProblem(fmt::format("no purge or query of a client was answered for {} s, after {}",
                                    kMostSecondsWithoutAnswer, answers));
    }
    return stands_;
  }

  void look(const Step& step) {
    world_.lookAfter();
    const double now = monotonicSeconds();
    if (now >= next_sample_seconds_) {
      samples_.push_back(sampleOf(world_.daemon()));
      next_sample_seconds_ = now + kSampleSeconds;
    }
    if (now >= next_progress_seconds_ && !samples_.empty()) {
      const Sample& last = samples_.back();
      fmt::print(stderr,
                 "{:5.0f} s  {:<13} PSS {:.0f} KiB, {:.0f} descriptors, {:.0f} threads, {} crashes "
                 "of services\n",
                 now - begin_seconds_, nameOf(step.phase), last.pss_kib, last.descriptors,
                 last.threads, world_.crashes());
      next_progress_seconds_ = now + kProgressSeconds;
    }
    sleepSeconds(kLookSeconds);
  }

  /// All of them, for whoever wants to look closer than the report does.
  void writeSamples() const {
    std::ofstream file("/tmp/samples.times");
    for (const Sample& sample : samples_) {
      file << fmt::format("{:.1f} {:.0f} {:.0f} {:.0f} {:.0f} {:.2f}\n", sample.at_seconds,
                          sample.rss_kib, sample.pss_kib, sample.descriptors, sample.threads,
                          sample.cpu_seconds);
    }
  }

  int report() {
    int missed = reportFlatness(samples_, periods_);
    const Latencies latencies = latenciesOf(readFile(kProbeLog), periods_);
    missed += reportLatencies(latencies);
    fmt::print("\n{}{}", readFile("/tmp/clients.log"), readFile("/tmp/hostile.log"));
    const auto services = World::servicesInQueries();
    if (!services) world_.addProblem("the last queries were not answered");
    for (const std::string& problem : world_.problems()) fmt::print("problem: {}\n", problem);
    missed += static_cast<int>(world_.problems().size());
    fmt::print(
        "\nsoak of {:.1f} minutes: {} services of 200 in the last answers, {} crashes, p99 "
        "of a small call {} us unloaded, {} us loaded, {} us flooded, {} targets missed\n",
        (monotonicSeconds() - begin_seconds_) / 60, services.value_or(0), world_.crashes(),
        wholeP99(latencies, Phase::kUnloaded), wholeP99(latencies, Phase::kLoaded),
        wholeP99(latencies, Phase::kFlooded), missed);
    return missed == 0 ? 0 : 1;
  }

  static long wholeP99(const Latencies& latencies, Phase phase) {
    return static_cast<long>(p99Of(latencies, phase, 0));
  }

  const std::vector<Step> plan_;
  World world_;
  double begin_seconds_ = 0;
  double next_sample_seconds_ = 0;
  double next_progress_seconds_ = 0;
  double clients_begin_seconds_ = 0;
  double last_answer_seconds_ = 0;
  long last_answers_ = 0;
  bool stands_ = false;
  std::vector<Sample> samples_;
  std::vector<Period> periods_;
};

}  // namespace
}  // namespace soak

int main(int count, char** arguments) {
  const double minutes = count == 2 ? std::strtod(arguments[1], nullptr) : 0;
  if (minutes < 2) {
    fmt::print(stderr, "Usage: soak-conductor MINUTES, at least 2\n");
    return 2;
  }
  try {
    return soak::Conductor(minutes).play();
  } catch (const std::exception& problem) {
    fmt::print(stderr, "soak: {}\n", problem.what());
    return 1;
  }
}
