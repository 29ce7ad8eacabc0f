// The numbers that every seed of this project stands on.
#include "support/runtime/splitmix.h"

#include <gtest/gtest.h>

#include <cstdint>

namespace spacekeep {
namespace {

// The sequence of its inventors' generator; a seed gives the same schedule as long as this holds.
TEST(SplitMix, GivesTheKnownSequence) {
  rt::SplitMix random(1234567);
  for (const std::uint64_t expected :
       {6457827717110365317U, 3203168211198807973U, 9817491932198370423U, 4593380528125082431U,
        16408922859458223821U}) {
    EXPECT_EQ(random.next(), expected);
  }
}

}  // namespace
}  // namespace spacekeep
