// Who is read first when many connections have something to say at once.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "tests/linux/ipc/bus_world.h"
#include "tests/linux/ipc/busy_loop.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

constexpr int kTurn = 8;      // messages of one connection, before the next one is read
constexpr int kBacklog = 60;  // a connection may have 64 without an answer
constexpr std::int32_t kQuiet = 1'000'000;

/// Served by the thread that reads, so that the order of serving is that of reading.
void sendBriefly(BareClient& client, std::int32_t number) {
  sd_bus_message* call = client.newCall("numberBriefly");
  ASSERT_GE(sd_bus_message_append(call, "i", number), 0);
  ASSERT_GE(sd_bus_send(client.bus(), call, nullptr), 0);
  sd_bus_message_unref(call);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
}

/// Answered by the thread that reads: a worker that answers may be at it for a moment longer, and would
/// serve the next calls of the connection as well.
std::unique_ptr<BareClient> connected(TestServer& server) {
  auto client = std::make_unique<BareClient>(server.path());
  sd_bus_message* call = client->newCall("Ping", "org.freedesktop.DBus.Peer", "/");
  EXPECT_EQ(client->errorOf(call), "");
  return client;
}

/// Of each client kBacklog numbers, its place times 1000 and up.
void sendBacklogs(std::vector<std::unique_ptr<BareClient>>& clients) {
  for (int i = 0; i < kBacklog; ++i) {
    std::int32_t place = 0;
    for (auto& client : clients) sendBriefly(*client, 1000 * place++ + i);
  }
}

TEST(Priorities, NoConnectionIsReadForMoreThanItsTurnWhileAnotherOneWaits) {
  TestServer server;
  std::vector<std::unique_ptr<BareClient>> clients;
  for (int i = 0; i < 3; ++i) clients.push_back(connected(server));
  BusyLoop busy(server.loop);
  sendBacklogs(clients);
  busy.letGo();
  ASSERT_TRUE(eventually([&] { return server.numbers().size() == 3 * kBacklog; }));
  const std::vector<std::int32_t> numbers = server.numbers();
  int in_a_row = 0;
  for (std::size_t i = 0; i < numbers.size(); ++i) {
    in_a_row = i > 0 && numbers[i] / 1000 == numbers[i - 1] / 1000 ? in_a_row + 1 : 1;
    ASSERT_LE(in_a_row, kTurn) << "at number " << i;
  }
}

/// Where in the order of serving the call of kQuiet comes that `send` sends once each of ten busy
/// connections has had its turn and has most of its backlog left, counted from there.
std::ptrdiff_t placeBehindBacklogs(TestServer& server, const std::function<void()>& send) {
  std::vector<std::unique_ptr<BareClient>> clients;
  for (int i = 0; i < 10; ++i) clients.push_back(connected(server));
  const std::size_t served_first = server.numbers().size();
  BusyLoop busy(server.loop);
  sendBacklogs(clients);
  BusyLoop busy_again(server.loop, &busy);
  const std::size_t served_before = server.numbers().size();
  EXPECT_EQ(served_before, served_first + 10 * kTurn);
  send();
  busy_again.letGo();
  EXPECT_TRUE(eventually([&] { return server.numbers().size() == served_first + 601; }));
  const std::vector<std::int32_t> numbers = server.numbers();
  const auto found = std::find(numbers.begin(), numbers.end(), kQuiet);
  return found - numbers.begin() - static_cast<std::ptrdiff_t>(served_before);
}

TEST(Priorities, AQuietConnectionIsReadBeforeTheBacklogsOfBusyOnes) {
  TestServer server;
  const auto quiet = connected(server);
  EXPECT_LE(placeBehindBacklogs(server, [&] { sendBriefly(*quiet, kQuiet); }), kTurn);
}

TEST(Priorities, ABusyConnectionThatWasServedToTheLastCountsAsQuietAgain) {
  TestServer server;
  const auto once_busy = connected(server);
  {
    const BusyLoop busy(server.loop);
    for (int i = 0; i < kBacklog; ++i) sendBriefly(*once_busy, i);
  }
  ASSERT_TRUE(eventually([&] { return server.numbers().size() == kBacklog; }));
  EXPECT_LE(placeBehindBacklogs(server, [&] { sendBriefly(*once_busy, kQuiet); }), kTurn);
}

TEST(Priorities, AConnectionWhoseCallComesInPiecesCountsAsQuiet) {
  TestServer server;
  const auto quiet = connected(server);
  std::string body;
  for (unsigned shift = 0; shift < 32; shift += 8)
    body += static_cast<char>(kQuiet >> shift & 0xff);
  const std::string call =
      RawMessage().callOf("numberBriefly").text(8, 'g', "i").bytes(1, 1000, body);
  const auto send = [fd = sd_bus_get_fd(quiet->bus())](std::string_view bytes) {
    ASSERT_EQ(::send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL), bytes.size());
  };
  {
    BusyLoop busy(server.loop);
    send(std::string_view(call).substr(0, 40));
    const BusyLoop after_one_look(server.loop, &busy);
  }
  EXPECT_LE(placeBehindBacklogs(server, [&] { send(std::string_view(call).substr(40)); }), kTurn);
}

TEST(Priorities, ACallOfAQuietClientDoesNotWaitForEverythingThatIsPosted) {
  constexpr int kPosted = 500;
  TestServer server;
  const auto quiet = connected(server);
  std::atomic<int> ran{0};
  std::size_t served_at_half = 0;  // IPC thread
  {
    const BusyLoop busy(server.loop);
    for (int i = 0; i < kPosted; ++i) {
      server.loop.post([&server, &ran, &served_at_half] {
        if (++ran == kPosted / 2) served_at_half = server.numbers().size();
      });
    }
    sendBriefly(*quiet, kQuiet);
  }
  ASSERT_TRUE(eventually([&ran] { return ran == kPosted; }));
  EXPECT_EQ(served_at_half, 1U);
}

}  // namespace
}  // namespace spacekeep::ipc::test
