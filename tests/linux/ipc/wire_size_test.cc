// The size of a message as it is known before it is sent, on which the limits hang.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>

#include <array>
#include <string>

#include "support/ipc/linux/authenticated_bus.h"
#include "support/ipc/linux/wire_header.h"
#include "support/ipc/linux/wire_writer.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

struct Sizes {
  std::size_t told = 0;
  std::uint64_t body = 0;
  std::uint64_t header = 0;
};

/// Of a call of "echo" with that info.
Sizes sizesOf(const Dictionary& info) {
  const SocketPair pair = makeSocketPair();
  sd_bus* bus = makeAuthenticatedBus(pair.first->fd()).bus;
  sd_bus_message* call = nullptr;
  EXPECT_GE(sd_bus_message_new_method_call(bus, &call, nullptr, kObjectPath, "com.quorvel.IpcTest",
                                           "echo"),
            0);
  WireWriter writer(call);
  const Arguments arguments = {
      std::int32_t{1},          std::string("text"),       info,
      OptionalDictionary(info), OptionalValue(Value(1.5)), OptionalString("four")};
  EXPECT_TRUE(writer.write(testInterface().method("echo")->in, arguments));
  EXPECT_GE(sd_bus_send(bus, call, nullptr), 0);
  std::array<char, kWireFixedBytes> bytes{};
  EXPECT_EQ(::recv(pair.second->fd(), bytes.data(), bytes.size(), 0),
            static_cast<ssize_t>(bytes.size()));
  const auto fixed = readWireFixedHeader({bytes.data(), bytes.size()});
  sd_bus_message_unref(call);
  sd_bus_close_unref(bus);
  if (!fixed) return {};
  return {writer.bytes() - WireWriter::kMostHeaderBytes,
          fixed->messageBytes() - fixed->headerBytes(), fixed->headerBytes()};
}

TEST(WireSize, OfTheBodyIsKnownToTheByteForEveryKindOfValue) {
  for (const Value& value :
       {Value("text"), Value(""), Value("a\xC3("), Value(true), Value(-1), Value(std::uint64_t{7}),
        Value(0.25), Value(Data{{1, 2, 3}}), Value(Data{}), Value(Date{5}), Value(Array{}),
        Value(Array{1, "b", 2.0}), Value(Dictionary{}),
        Value(Dictionary{{"k", 1}, {"list", Array{"x"}}})}) {
    for (const std::string key : {"", "a", "ab", "abc", "abcd", "abcde", "abcdef", "abcdefg"}) {
      const Sizes sizes = sizesOf({{key, value}, {"then", value}});
      EXPECT_EQ(sizes.told, sizes.body) << key;
      EXPECT_LE(sizes.header, WireWriter::kMostHeaderBytes);
    }
  }
}

}  // namespace
}  // namespace spacekeep::ipc::test
