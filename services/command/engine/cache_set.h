// Thread safety: every member may be called from any thread. Requests to free take turns.
//
// All caches of one owner behind one service: one process, one connection, one check-in, however
// many rules there are.
#pragma once

#include <memory>
#include <set>
#include <string>
#include <vector>

#include "services/command/engine/cache.h"
#include "support/runtime/runtime.h"

namespace spacekeep::command {

class CacheSet {
 public:
  /// Rules that are switched off are left out. `folders` must outlive the set.
  CacheSet(std::vector<Rule> rules, const UserFolders* folders);

  [[nodiscard]] const std::vector<std::unique_ptr<Cache>>& caches() const { return caches_; }
  /// The sums.
  [[nodiscard]] Offer offer(const std::optional<std::string>& volume, const CancelToken& cancel);
  /// One cache after the other, in the order of the rules, until the amount is there. The daemon
  /// itself goes from urgency to urgency, so what is mild anywhere goes before what is not.
  [[nodiscard]] Result free(const Request& request, const CancelToken& cancel,
                            const Visitor& visit = {});

 private:
  void keepNews(const Cache& cache, const std::string& note, std::vector<std::string> problems,
                std::vector<std::string>& into);
  [[nodiscard]] bool begin(const CancelToken& cancel);
  void end();

  std::vector<std::unique_ptr<Cache>> caches_;
  rt::Mutex mutex_;
  rt::CondVar changed_;
  bool busy_ = false;           // guarded by mutex_
  std::set<std::string> told_;  // guarded by mutex_: notes are told once
};

}  // namespace spacekeep::command
