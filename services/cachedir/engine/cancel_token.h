// Thread safety: every member may be called from any thread, if the caller's own question may.
//
// Whether a request has been cancelled. One counter serves all requests of an engine: a cancel
// raises it, and a request is cancelled when it no longer reads what it read at its start. A
// request that begins after the cancel is thereby untouched by it. Besides, the one who asks may
// bring a question of his own.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <utility>

namespace spacekeep::cachedir {

class CancelToken {
 public:
  using Question = std::function<bool()>;

  /// Never cancelled.
  CancelToken() = default;
  explicit CancelToken(Question question) : question_(std::move(question)) {}
  CancelToken(const std::atomic<std::uint64_t>& cancels, Question question)
      : cancels_(&cancels),
        at_start_(cancels.load(std::memory_order_acquire)),
        question_(std::move(question)) {}

  [[nodiscard]] bool cancelled() const {
    return (cancels_ != nullptr && cancels_->load(std::memory_order_acquire) != at_start_) ||
           (question_ && question_());
  }

 private:
  const std::atomic<std::uint64_t>* cancels_ = nullptr;
  std::uint64_t at_start_ = 0;
  Question question_;
};

}  // namespace spacekeep::cachedir
