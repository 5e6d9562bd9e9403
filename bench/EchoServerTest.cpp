#include <gtest/gtest.h>
#include <signal.h>

#include <cerrno>
#include <thread>

#include "bench/EchoServer.h"

namespace {

std::unique_ptr<EchoServer> startEcho(std::size_t sockets) {
  auto echo = EchoServer::start(sockets, std::vector<std::uint8_t>(37, 0x11),
                                std::vector<std::uint8_t>(14, 0x22));
  EXPECT_TRUE(echo.ok());
  return echo.ok() ? std::move(echo).value() : nullptr;
}

TEST(EchoServer, AnswersEverySocketOnItsOwn) {
  auto echo = startEcho(3);
  ASSERT_TRUE(echo);
  // Interleaved on one thread: a reply of the wrong size would leave bytes for the next socket's
  // turn or block it.
  for (int round = 0; round < 20; ++round) {
    for (std::size_t i = 0; i < 3; ++i) EXPECT_TRUE(echo->roundTrip(i).ok());
  }
  std::vector<std::thread> clients;
  for (std::size_t i = 0; i < 3; ++i) {
    clients.emplace_back([&echo, i] {
      for (int round = 0; round < 200; ++round) EXPECT_TRUE(echo->roundTrip(i).ok());
    });
  }
  for (auto& client : clients) client.join();
}

TEST(EchoServer, FailsInsteadOfWaitingForNobody) {
  auto echo = startEcho(2);
  ASSERT_TRUE(echo);
  os::Status outOfRange = echo->roundTrip(2);
  ASSERT_FALSE(outOfRange.ok());
  EXPECT_EQ(outOfRange.error().errnum, EINVAL);

  ASSERT_EQ(kill(echo->pid(), SIGKILL), 0);
  EXPECT_FALSE(echo->roundTrip(0).ok());
  EXPECT_FALSE(echo->roundTrip(1).ok());
}

}  // namespace
