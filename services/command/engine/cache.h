// Thread safety: estimates may run beside anything; whoever frees takes turns.
//
// One cache as a service sees it, however it is cleaned.
#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "services/cachedir/engine/cancel_token.h"
#include "services/command/rules/rule.h"

namespace spacekeep::command {

using cachedir::CancelToken;

struct Offer {
  /// What urgency 1 to 4 could free; each holds what the milder ones hold.
  std::array<std::uint64_t, kUrgencies> bytes{};
  /// Where the tool cannot tell beforehand; `bytes` then promises nothing.
  std::array<bool, kUrgencies> unknown{};
  std::string note;                   // why there is nothing just now, when there is a reason
  std::vector<std::string> problems;  // in words
};

struct Request {
  std::uint64_t amount = 0;  // bytes
  int urgency = 0;           // 1 to 4
  bool periodic = false;
  std::optional<std::string> volume = {};  // mount point; absent means all
  bool dry_run = false;
};

struct Result {
  std::uint64_t bytes = 0;
  std::string note;
  std::vector<std::string> problems;
};

/// Told of each file, directory or command as it goes or runs (or would), with its bytes; without
/// them where a command would run of which nobody can tell what it frees.
using Visitor = std::function<void(const std::string& what, std::optional<std::uint64_t> bytes)>;

class Cache {
 public:
  explicit Cache(Rule rule) : rule_(std::move(rule)) {}
  virtual ~Cache() = default;
  Cache(const Cache&) = delete;
  Cache& operator=(const Cache&) = delete;

  [[nodiscard]] const Rule& rule() const { return rule_; }
  /// What could be freed on that volume (a mount point; absent: anywhere).
  [[nodiscard]] virtual Offer offer(const std::optional<std::string>& volume,
                                    const CancelToken& cancel) const = 0;
  [[nodiscard]] virtual Result free(const Request& request, const CancelToken& cancel,
                                    const Visitor& visit) const = 0;

 private:
  const Rule rule_;
};

/// `folders` is the user's, null for the system's caches; it must outlive the cache.
[[nodiscard]] std::unique_ptr<Cache> makeCache(Rule rule, const UserFolders* folders);

}  // namespace spacekeep::command
