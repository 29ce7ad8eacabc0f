#include "soak/report.h"

#include <fmt/format.h>

#include <algorithm>
#include <sstream>
#include <string_view>

#include "soak/figures.h"
#include "soak/world.h"

namespace soak {
namespace {

/// After a flood its connections take this long to be gone everywhere; samples of that time are
/// shown and do not count.
constexpr double kSettlingSeconds = 10;
constexpr double kMostSlowdown = 5;

/// What a call takes in a phase, compared with nobody but the probe.
double slowdown(const Latencies& latencies, Phase phase, std::size_t peer) {
  const double unloaded_us = p99Of(latencies, Phase::kUnloaded, peer);
  return unloaded_us > 0 ? p99Of(latencies, phase, peer) / unloaded_us : 0;
}

// What the fitted line may rise by over the last two thirds. A leak of one small allocation (32
// bytes) per call would be 2 MiB over the 20 minutes of a full soak at its 60 calls a second; a
// leaked descriptor or thread per crash of a service would be dozens.
constexpr double kMostRiseKib = 1024;
constexpr double kMostRiseCount = 4;

struct Quantity {
  const char* name;
  double Sample::*value;
  double most_rise;
};

constexpr Quantity kQuantities[] = {
    {"PSS KiB", &Sample::pss_kib, kMostRiseKib},
    {"descriptors", &Sample::descriptors, kMostRiseCount},
    {"threads", &Sample::threads, kMostRiseCount},
};

const Period* periodAt(const std::vector<Period>& periods, double seconds) {
  for (const Period& period : periods) {
    if (seconds >= period.begin_seconds && seconds < period.end_seconds) return &period;
  }
  return nullptr;
}

bool counts(const Sample& sample, const std::vector<Period>& periods) {
  const Period* period = periodAt(periods, sample.at_seconds);
  return period != nullptr && period->phase == Phase::kLoaded &&
         sample.at_seconds >= period->begin_seconds + kSettlingSeconds;
}

void printSamples(const std::vector<Sample>& samples, const std::vector<Period>& periods) {
  constexpr std::size_t kRows = 30;
  fmt::print("\n{:>8}  {:<13} {:>9} {:>9} {:>12} {:>8} {:>7}\n", "second", "phase", "RSS KiB",
             "PSS KiB", "descriptors", "threads", "CPU %");
  const std::size_t step = std::max<std::size_t>(1, samples.size() / kRows);
  for (std::size_t i = step; i < samples.size(); i += step) {
    const Sample& now = samples[i];
    const Sample& before = samples[i - step];
    const Period* period = periodAt(periods, now.at_seconds);
    fmt::print("{:8.0f}  {:<13} {:9.0f} {:9.0f} {:12.0f} {:8.0f} {:7.1f}\n",
               now.at_seconds - samples.front().at_seconds,
               period == nullptr ? "" : nameOf(period->phase), now.rss_kib, now.pss_kib,
               now.descriptors, now.threads,
               100 * (now.cpu_seconds - before.cpu_seconds) / (now.at_seconds - before.at_seconds));
  }
}

int judge(const Quantity& quantity, const std::vector<Sample>& counted) {
  std::vector<double> x;
  std::vector<double> y;
  for (const Sample& sample : counted) {
    x.push_back(sample.at_seconds);
    y.push_back(sample.*quantity.value);
  }
  const Line line = fittedLine(x, y);
  const double window_seconds = x.empty() ? 0 : x.back() - x.front();
  const double rise = line.slope * window_seconds;
  // Threads and descriptors come and go with what is asked just then, so a line through them is
  // uncertain: missed is what has certainly risen by more than the bound.
  const double certain_rise = rise - 2 * line.standard_error * window_seconds;
  const bool flat = x.size() >= 3 && certain_rise <= quantity.most_rise;
  fmt::print(
      "{:<12} mean {:9.1f}  slope {:+9.4f} +- {:.4f} a minute, {:+8.1f} in {:.0f} s (with "
      "certainty "
      "{:+.1f} to {:+.1f}; the lower one at most {:.0f}): {}\n",
      quantity.name, mean(y), line.slope * 60, line.standard_error * 60, rise, window_seconds,
      certain_rise, 2 * rise - certain_rise, quantity.most_rise, flat ? "flat" : "NOT FLAT");
  return flat ? 0 : 1;
}

void printLatencies(const Latencies& latencies) {
  constexpr const char* kNames[] = {"daemon", "bare peer, never flooded", "bare peer, flooded"};
  fmt::print("\n{:<26} {:<13} {:>7} {:>10} {:>10} {:>10}\n", "small call to", "phase", "calls",
             "p50 us", "p99 us", "max us");
  for (std::size_t peer = 0; peer < kProbed.size(); ++peer) {
    for (const auto& [key, times_us] : latencies) {
      if (key.second != peer) continue;
      fmt::print("{:<26} {:<13} {:7} {:10.0f} {:10.0f} {:10.0f}\n", kNames[peer], nameOf(key.first),
                 times_us.size(), percentile(times_us, 0.5), percentile(times_us, 0.99),
                 percentile(times_us, 1));
    }
  }
}

}  // namespace

double p99Of(const Latencies& latencies, Phase phase, std::size_t peer) {
  const auto found = latencies.find({phase, peer});
  return found == latencies.end() ? 0 : percentile(found->second, 0.99);
}

Latencies latenciesOf(const std::string& log, const std::vector<Period>& periods) {
  Latencies latencies;
  std::istringstream lines(log);
  double at_seconds = 0;
  std::size_t peer = 0;
  double took_us = 0;
  while (lines >> at_seconds >> peer >> took_us) {
    const Period* period = periodAt(periods, at_seconds);
    if (period != nullptr) latencies[{period->phase, peer}].push_back(took_us);
  }
  return latencies;
}

int reportFlatness(const std::vector<Sample>& samples, const std::vector<Period>& periods) {
  printSamples(samples, periods);
  const double begin = samples.front().at_seconds;
  const double end = samples.back().at_seconds;
  std::vector<Sample> counted;
  for (const Sample& sample : samples) {
    if (sample.at_seconds >= begin + (end - begin) / 3 && counts(sample, periods)) {
      counted.push_back(sample);
    }
  }
  fmt::print("\nThe last two thirds, {} samples under load and without a flood:\n", counted.size());
  int missed = 0;
  for (const Quantity& quantity : kQuantities) missed += judge(quantity, counted);
  return missed;
}

int reportLatencies(const Latencies& latencies) {
  printLatencies(latencies);
  const double raw = slowdown(latencies, Phase::kFlooded, 0);
  const double floor = slowdown(latencies, Phase::kFlooded, 1);
  const double own = raw / std::max(1.0, floor);
  const bool good = raw > 0 && own <= kMostSlowdown;
  fmt::print(
      "\np99 over its unloaded value:\n"
      "  loaded          daemon {:6.2f}, bare peer {:6.2f}\n"
      "  flooded, raw    daemon {:6.2f}, bare peer that nobody floods {:6.2f}\n"
      "  flooded, corrected for what that bare peer loses: {:.2f} (at most {:.0f}: {}); raw it is "
      "{}\n"
      "  a bare peer that is flooded itself with the small calls alone: {:.2f}\n",
      slowdown(latencies, Phase::kLoaded, 0), slowdown(latencies, Phase::kLoaded, 1), raw, floor,
      own, kMostSlowdown, good ? "ok" : "OVER", raw <= kMostSlowdown ? "ok" : "OVER",
      slowdown(latencies, Phase::kBareFlooded, 2));
  return good ? 0 : 1;
}

}  // namespace soak
