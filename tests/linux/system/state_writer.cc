#include "tests/linux/system/state_writer.h"

#include <gtest/gtest.h>

namespace spacekeep::system_test {

void StateWriter::writeUntilTheEnd(sdk::Client& client) {
  while (true) {
    ++sent_;
    if (!client.setState(key_, value(sent_)).ok()) return;
    answered_ = sent_;
    ++answers_;
  }
}

bool StateWriter::check(sdk::Client& client) {
  const sdk::StateReply reply = client.state(key_);
  if (reply.error) return false;
  for (std::uint64_t possible = answered_; possible <= sent_; ++possible) {
    if (possible == 0 ? !reply.value : reply.value == value(possible)) {
      answered_ = sent_ = possible;
      return true;
    }
  }
  ++lost_;
  ADD_FAILURE() << key_ << ": answered " << answered_ << ", sent " << sent_
                << ", and the daemon holds neither";
  return true;
}

// Of changing size, up to some pages: commits of every shape.
Value StateWriter::value(std::uint64_t count) const {
  const std::size_t size = (count * 977) % (number_ == 0 ? 20'000 : 500);
  return Dictionary{{"COUNT", count}, {"TEXT", std::string(size, 'x')}};
}

}  // namespace spacekeep::system_test
