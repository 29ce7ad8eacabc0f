// Thread safety: pure functions, apart from what the given function does.
//
// Makes a failing plan smaller: takes elements away as long as it still fails in the same way.
#pragma once

#include <cstddef>
#include <functional>
#include <vector>

namespace spacekeep::sim {

/// Positions of the elements that are kept, ascending.
using Kept = std::vector<std::size_t>;

struct Shrunk {
  Kept kept;
  unsigned runs = 0;       ///< how often `fails` was asked
  bool is_minimal = true;  ///< no single element can go any more; false when the runs were used up
};

/// Halves, quarters and so on down to single elements are taken away, again and again until nothing
/// can go, in at most `max_runs` runs. `fails` is not asked about all elements together: that they
/// fail is why one is here.
[[nodiscard]] Shrunk shrink(std::size_t elements, const std::function<bool(const Kept&)>& fails,
                            unsigned max_runs);

}  // namespace spacekeep::sim
