// Thread safety: confined to the daemon's collection_queue.
//
// Running purges by the token of their request.
#pragma once

#include <algorithm>
#include <memory>
#include <utility>
#include <vector>

#include "operations/operation.h"

namespace spacekeep {

class PurgeOperations {
 public:
  void set(const Value& token, std::shared_ptr<OperationInterface> operation) {
    remove(token);
    entries_.emplace_back(token, std::move(operation));
  }
  void remove(const Value& token) {
    std::erase_if(entries_, [&](const auto& entry) { return entry.first == token; });
  }
  /// Null when there is none.
  [[nodiscard]] std::shared_ptr<OperationInterface> find(const Value& token) const {
    for (const auto& [known, operation] : entries_) {
      if (known == token) return operation;
    }
    return nullptr;
  }

 private:
  std::vector<std::pair<Value, std::shared_ptr<OperationInterface>>> entries_;
};

}  // namespace spacekeep
