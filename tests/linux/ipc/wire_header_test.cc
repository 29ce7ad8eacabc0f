// Headers of messages as they stand on the wire.
#include "support/ipc/linux/wire_header.h"

#include <gtest/gtest.h>

#include <string>

#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

RawMessage call() { return RawMessage().callOf("number"); }

TEST(WireHeader, ACallIsReadFieldByField) {
  const auto header = readWireHeader(call().text(7, 's', ":1.5").text(8, 'g', "i").bytes());
  ASSERT_TRUE(header);
  EXPECT_EQ(header->fixed.type, kWireCall);
  EXPECT_EQ(header->fixed.serial, 7U);
  EXPECT_EQ(header->path, kObjectPath);
  EXPECT_EQ(header->interface, "com.quorvel.IpcTest");
  EXPECT_EQ(header->member, "number");
  EXPECT_EQ(header->destination, kTestBusName);
  EXPECT_EQ(header->sender, ":1.5");
  EXPECT_EQ(header->signature, "i");
  EXPECT_FALSE(header->descriptors);
}

TEST(WireHeader, WhatSdBusCouldDropIsNone) {
  EXPECT_FALSE(readWireHeader(call().text(3, 's', "again").bytes()));
  EXPECT_FALSE(readWireHeader(call().text(4, 's', "NoDot").bytes()));
  EXPECT_FALSE(readWireHeader(call().text(77, 's', "unknown").bytes()));
  EXPECT_FALSE(readWireHeader(call().number(5, 0).bytes()));
  EXPECT_FALSE(readWireHeader(call().bytes(1, 0)));
  EXPECT_FALSE(readWireHeader(call().bytes(5)));
}

TEST(WireHeader, WithoutWhatItsTypeNeedsItIsNone) {
  EXPECT_FALSE(readWireHeader(RawMessage().text(1, 'o', "/a").bytes(1)));
  EXPECT_FALSE(readWireHeader(RawMessage().text(3, 's', "a").bytes(1)));
  EXPECT_FALSE(readWireHeader(call().bytes(2)));
  EXPECT_FALSE(readWireHeader(call().number(5, 1).bytes(3)));
  EXPECT_TRUE(readWireHeader(call().number(5, 1).bytes(2)));
  EXPECT_TRUE(readWireHeader(call().number(5, 1).text(4, 's', "a.b").bytes(3)));
  EXPECT_TRUE(readWireHeader(call().bytes(4)));
}

TEST(WireHeader, AnyLengthButTheRightOneIsNone) {
  const std::string bytes = call().bytes();
  for (std::size_t length = 0; length < bytes.size(); ++length) {
    EXPECT_FALSE(readWireHeader(bytes.substr(0, length))) << length;
  }
  EXPECT_TRUE(readWireHeader(bytes));
  EXPECT_FALSE(readWireHeader(bytes + std::string(8, '\0')));
}

TEST(WireHeader, PaddingThatIsNotZeroIsNone) {
  std::string bytes = call().text(7, 's', ":1.5").bytes();
  ASSERT_EQ(bytes.back(), '\0');
  const auto fixed = readWireFixedHeader(bytes);
  ASSERT_TRUE(fixed);
  ASSERT_LT(kWireFixedBytes + fixed->field_bytes, bytes.size());
  bytes.back() = 'x';
  EXPECT_FALSE(readWireHeader(bytes));
}

}  // namespace
}  // namespace spacekeep::ipc::test
