// Thread safety: every member may be called from any thread.
//
// A service for tests: counts what it is asked, and holds its purges until it is told otherwise.
#pragma once

#include <spacekeep/service.h>

#include <atomic>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/runtime/guarded.h"

namespace spacekeep::sdk {

class TestService : public Service {
 public:
  Answer purgeable(const Job& job) override {
    const Inside here(*this);
    last_job.set(job);
    return {.amount = 1000, .more = {{"note", "cached"}, {"SPACEKEEP_AMOUNT", "overruled"}}};
  }
  Answer purge(const Job& job) override {
    const Inside here(*this);
    last_job.set(job);
    ++purges;
    if (throwing) throw std::runtime_error("the disk is on fire");
    if (holding) {
      cancelled_purges += job.cancellation.waitFor(std::chrono::seconds(20)) ? 1 : 0;
    }
    return {.amount = job.amount, .more = {}};
  }
  void notify(const std::string& name, const Value& value) override {
    notes.update([&](auto& list) { list.push_back({name, value}); });
  }
  void cancelRequested() override { ++cancel_requests; }
  void pinged() override { ++pings; }

  rt::Guarded<Job> last_job;
  rt::Guarded<std::vector<Dictionary::Entry>> notes;
  std::atomic<int> purges = 0, cancelled_purges = 0, cancel_requests = 0, pings = 0;
  std::atomic<int> inside = 0, most_inside = 0;
  std::atomic<bool> holding = false, throwing = false;

 private:
  struct Inside {
    explicit Inside(TestService& service) : service_(service) {
      const int now = ++service_.inside;
      if (now > service_.most_inside) service_.most_inside = now;
    }
    ~Inside() { --service_.inside; }
    TestService& service_;
  };
};

}  // namespace spacekeep::sdk
