#include "services/cachedir/engine/candidates.h"

#include <algorithm>
#include <utility>

namespace spacekeep::cachedir {
namespace {

bool earlier(const Candidate& left, const Candidate& right) { return left.turn < right.turn; }

std::size_t textBytes(const Link& link) { return link.name.size() + link.folder->path.size(); }

}  // namespace

std::size_t textBytes(const Candidate& candidate) {
  std::size_t sum = textBytes(candidate.first);
  for (const Link& link : candidate.others) sum += textBytes(link);
  return sum;
}

void OldestFiles::offer(Candidate candidate) {
  if (!wants(candidate.turn)) return;
  text_bytes_ += textBytes(candidate);
  heap_.push_back(std::move(candidate));
  std::push_heap(heap_.begin(), heap_.end(), earlier);
  while (heap_.size() > 1 && (heap_.size() > max_files_ || text_bytes_ > max_text_bytes_)) {
    dropYoungest();
  }
}

void OldestFiles::dropYoungest() {
  std::pop_heap(heap_.begin(), heap_.end(), earlier);
  text_bytes_ -= textBytes(heap_.back());
  ceiling_ = overflowed_ ? std::min(ceiling_, heap_.back().turn) : heap_.back().turn;
  overflowed_ = true;
  heap_.pop_back();
}

std::vector<Candidate> OldestFiles::takeInOrder() {
  std::sort_heap(heap_.begin(), heap_.end(), earlier);
  text_bytes_ = 0;
  return std::exchange(heap_, {});
}

}  // namespace spacekeep::cachedir
