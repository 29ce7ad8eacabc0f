// Descriptors that come with messages which are never served: not one of them stays open.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

#include "support/ipc/linux/wire_signature.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

using namespace std::string_view_literals;

std::size_t openDescriptors() {
  const std::filesystem::directory_iterator entries("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

std::string numberBytes(std::size_t number) {
  std::string bytes;
  for (unsigned shift = 0; shift < 32; shift += 8) {
    bytes += static_cast<char>(number >> shift & 0xff);
  }
  return bytes;
}

struct Fields {
  std::string bytes;

  Fields& text(char code, char type, std::string_view text) {
    bytes.resize((bytes.size() + 7) / 8 * 8, '\0');
    bytes += {code, 1, type, 0};
    bytes +=
        type == 'g' ? std::string(1, static_cast<char>(text.size())) : numberBytes(text.size());
    bytes += text;
    bytes += '\0';
    return *this;
  }
  Fields& number(char code, std::size_t number) {
    bytes.resize((bytes.size() + 7) / 8 * 8, '\0');
    bytes += {code, 1, 'u', 0};
    bytes += numberBytes(number);
    return *this;
  }
  /// A message that ends with them.
  [[nodiscard]] std::string message(char type = 1) const {
    std::string message{'l', type, 0, 1};
    message += numberBytes(0) + numberBytes(7) + numberBytes(bytes.size()) + bytes;
    message.resize((message.size() + 7) / 8 * 8, '\0');
    return message;
  }
};

Fields call(std::string_view path = kObjectPath) {
  return Fields().text(1, 'o', path).text(3, 's', "takeDescriptor").text(8, 'g', "h");
}

bool sendWithDescriptors(int fd, std::string_view bytes, std::size_t count) {
  const SocketPair pair = makeSocketPair();
  const std::vector<int> passed(count, pair.first->fd());
  iovec part{.iov_base = const_cast<char*>(bytes.data()), .iov_len = bytes.size()};
  alignas(cmsghdr) char control[CMSG_SPACE(16 * sizeof(int))] = {};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = CMSG_SPACE(count * sizeof(int));
  cmsghdr* header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(count * sizeof(int));
  std::memcpy(CMSG_DATA(header), passed.data(), count * sizeof(int));
  return ::sendmsg(fd, &message, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

/// A peer sends `first` without and then `bytes` with descriptors, and is cut off for it.
void expectNoneStaysOpen(TestServer& server, std::string_view first, std::string_view bytes,
                         std::size_t count) {
  const std::size_t before = openDescriptors();
  // Often, since what an earlier connection had may still be counted above.
  for (int round = 0; round < 8; ++round) {
    RawPeer peer(server.path());
    peer.authenticate();
    EXPECT_TRUE(first.empty() || peer.send(first));
    EXPECT_TRUE(sendWithDescriptors(peer.fd(), bytes, count));
    EXPECT_TRUE(peer.isCutOff());
  }
  EXPECT_TRUE(eventually([before] { return openDescriptors() <= before; }))
      << openDescriptors() << " are open, " << before << " were";
}

class DescriptorMessage : public ::testing::Test {
 protected:
  DescriptorMessage() { expectHonestClientIsServed(server); }
  ~DescriptorMessage() override { expectHonestClientIsServed(server); }
  TestServer server;
};

TEST_F(DescriptorMessage, ThoseOfACallToWhatIsNoPathAreClosed) {
  expectNoneStaysOpen(server, "", call("no path").number(9, 2).message(), 2);
}

TEST_F(DescriptorMessage, ThoseOfACallThatTellsAnotherNumberAreClosed) {
  expectNoneStaysOpen(server, "", call().number(9, 1).message(), 2);
  expectNoneStaysOpen(server, "", call().message(), 1);
}

TEST_F(DescriptorMessage, ThoseOfACallWithAFieldTwiceOrUnknownAreClosed) {
  expectNoneStaysOpen(server, "", call().text(3, 's', "again").number(9, 1).message(), 1);
  expectNoneStaysOpen(server, "", call().number(77, 1).number(9, 1).message(), 1);
}

TEST_F(DescriptorMessage, ThoseOfACallWithABrokenSignatureAreClosed) {
  const Fields fields =
      Fields().text(1, 'o', kObjectPath).text(3, 's', "takeDescriptor").text(8, 'g', "a{vs}");
  expectNoneStaysOpen(server, "", Fields(fields).number(9, 1).message(), 1);
}

TEST_F(DescriptorMessage, ThoseOfAMessageThatIsNoCallAreClosed) {
  expectNoneStaysOpen(server, "", Fields().number(5, 1).number(9, 1).message(2), 1);
}

TEST_F(DescriptorMessage, MoreThanTheMostAreClosed) {
  expectNoneStaysOpen(server, "", call().number(9, 9).message(), 9);
}

TEST_F(DescriptorMessage, ThoseThatComeInTheMiddleOfAMessageAreClosed) {
  const std::string message = call("no path").number(9, 1).message();
  expectNoneStaysOpen(server, message.substr(0, 20), message.substr(20), 1);
  expectNoneStaysOpen(server, message.substr(0, 5), message.substr(5), 1);
}

TEST_F(DescriptorMessage, ThoseOfHalfAMessageAreClosed) {
  const std::string message = call().number(9, 1).message();
  expectNoneStaysOpen(server, "", message.substr(0, 40), 1);
}

TEST(DescriptorInAnAnswer, IsClosedAndTheCallFails) {
  TestServer client;                   // only for its threads
  expectHonestClientIsServed(client);  // what is opened on first use is open from then on
  for (const char* path : {"/", "no path"}) {
    const std::size_t before = openDescriptors();
    {
      SocketPair pair = makeSocketPair();
      const auto connection =
          connectionFromDescriptor(client.loop, client.global, std::move(pair.first));
      static const InterfaceDescription kService{"com.example.Service", {{"ask", {}, {}}}};
      connection->setRemoteInterface(kService);
      const std::string handshake =
          "DATA\r\nOK 0123456789abcdef0123456789abcdef\r\nAGREE_UNIX_FD\r\n";
      ASSERT_EQ(::send(pair.second->fd(), handshake.data(), handshake.size(), 0),
                static_cast<ssize_t>(handshake.size()));
      ASSERT_TRUE(sendWithDescriptors(
          pair.second->fd(), Fields().number(5, 1).text(1, 'o', path).number(9, 3).message(2), 3));
      PendingCall call(connection, "ask", {});
      connection->resume();
      EXPECT_TRUE(call.wait().error);
    }
    EXPECT_TRUE(eventually([before] { return openDescriptors() <= before; })) << path;
  }
}

TEST(WireSignature, CompleteTypesAreValid) {
  for (const std::string_view valid : {""sv, "s"sv, "sha{sv}"sv, "aa{sv}"sv, "(sx)"sv, "a{s(iv)}"sv,
                                       "ybnqiuxtdsoghv"sv, "a(a{ov}ah)"sv}) {
    EXPECT_TRUE(isWireSignature(valid)) << valid;
  }
  EXPECT_TRUE(isWireSignature(std::string(32, 'a') + "s"));
  EXPECT_TRUE(isWireSignature(std::string(32, '(') + "s" + std::string(32, ')')));
}

TEST(WireSignature, AnythingElseIsNot) {
  for (const std::string_view broken :
       {"a"sv, "()"sv, "("sv, ")"sv, "(s"sv, "{sv}"sv, "a{vs}"sv, "a{s}"sv, "a{sss}"sv, "a{sss"sv,
        "z"sv, "a{sv"sv, "r"sv, "e"sv}) {
    EXPECT_FALSE(isWireSignature(broken)) << broken;
  }
  EXPECT_FALSE(isWireSignature(std::string(33, 'a') + "s"));
  EXPECT_FALSE(isWireSignature(std::string(33, '(') + "s" + std::string(33, ')')));
  EXPECT_FALSE(isWireSignature(std::string(256, 's')));
}

}  // namespace
}  // namespace spacekeep::ipc::test
