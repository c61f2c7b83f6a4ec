// The daemon's and the client's ends of the IPC layer over real sockets: calls, answers, life cycle.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <future>

#include "platform/ipc/ExtensionTokens.h"
#include "platform/ipc/UnixSocket.h"
#include "protocol/ClientSessionReplyProxy.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/IPCHarness.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

std::vector<IPCArgument> message(int number, const char* action = "", std::size_t filling = 0) {
  return {Dictionary{{"n", number}, {"do", action}, {"filling", std::string(filling, 'x')}}};
}

TEST(IPCConnection, ServesPipelinedCallsInOrder) {
  TestService service;
  TestClient client(service);
  // Long messages take another path through the daemon than short ones.
  for (int i = 0; i < 2000; ++i)
    client.post("sendMessageWithDictionary", message(i, "", i % 7 == 0 ? 10'000 : 0));
  EXPECT_EQ(client.call("flushMessagesWithReply"), "posted all");
  auto lines = service.journal.lines();
  ASSERT_EQ(lines.size(), 2002u);
  for (int i = 0; i < 2000; ++i)
    ASSERT_EQ(lines[static_cast<std::size_t>(i) + 1], "message " + std::to_string(i));
}

TEST(IPCConnection, CallsTheClientInOrderFromAnyThread) {
  TestService service;
  TestClient client(service);
  ASSERT_EQ(client.call("flushMessagesWithReply"), "posted all");
  std::thread other([&] {
    ClientSessionReplyProxy proxy(service.connection(),
                                  [](const std::string& error) { ADD_FAILURE() << error; });
    for (std::uint16_t i = 0; i < 100; ++i)
      proxy.sendMessageToClient(Dictionary{{"i", i}}, 0.5, i, 9, std::nullopt);
  });
  EXPECT_TRUE(client.runUntil([&] { return client.received.size() == 100; }));
  other.join();
  EXPECT_EQ(client.received[0], R"(sendMessageToClient {"i": 0} 0.5 0 9 none)");
  EXPECT_EQ(client.received[99], R"(sendMessageToClient {"i": 99} 0.5 99 9 none)");
}

TEST(IPCConnection, ReadsNoCallsWhilePausedButSendsAndNoticesAHangUp) {
  TestService service;
  std::promise<void> ended;
  service.onInvalidation = [&] { ended.set_value(); };
  {
    TestClient client(service);
    ASSERT_EQ(client.call("flushMessagesWithReply"), "posted all");
    const auto connection = service.connection();
    connection->setPaused(true);
    client.post("sendMessageWithDictionary", message(1));
    ClientSessionReplyProxy proxy(connection, [](const std::string& error) { ADD_FAILURE() << error; });
    proxy.sendMessageToClient(Dictionary(), 0.5, 1, 9, std::nullopt);
    EXPECT_TRUE(client.runUntil([&] { return client.received.size() == 1; }));
    EXPECT_EQ(service.journal.lines().size(), 2u) << "the message was not read";
    connection->setPaused(false);
    EXPECT_EQ(client.call("flushMessagesWithReply"), "posted all");
    EXPECT_EQ(service.journal.lines().size(), 4u);
    connection->setPaused(true);
    client.post("sendMessageWithDictionary", message(2));
  }
  ended.get_future().wait();
  EXPECT_EQ(service.journal.lines().at(4), "message 2") << "it had been sent";
}

TEST(IPCConnection, AnswersWhatCannotBeServedWithAnError) {
  CapturedLog log;
  TestService service;
  TestClient client(service);
  EXPECT_EQ(client.call("sendMessageWithDictionary", message(1, "abandon")), "NoReply");
  EXPECT_EQ(client.call("sendMessageWithDictionary", message(1, "throw")), "NoReply");
  EXPECT_EQ(client.call("noSuchMember"), "UnknownMethod");
  EXPECT_EQ(client.call("fetchDisplayURL", {true}), "InvalidArgs");
  EXPECT_EQ(client.call("sendMessageWithDictionary", {List{}}), "InvalidArgs");
  EXPECT_EQ(client.call("flushMessagesWithReply", {}, "com.corvane.Other"), "UnknownInterface");
  EXPECT_EQ(client.call("flushMessagesWithReply"), "posted all") << "the connection goes on";
  EXPECT_EQ(log.countContaining(3, "ipc: connection"), 1) << "the exception";
}

TEST(IPCConnection, KeepsADescriptorUnderATokenThatIsGoodOnce) {
  TestService service;
  int pipe[2];
  ASSERT_EQ(::pipe(pipe), 0);
  FileDescriptor readEnd(pipe[0]);
  FileDescriptor writeEnd(pipe[1]);
  TestClient client(service);
  client.post("sendMessageWithDictionary", message(1));
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(client.call("uploadFileAtPath", {std::string("u"), IPCDescriptor{writeEnd.get()}}), "true");
  }
  auto lines = service.journal.lines();
  auto tokenOf = [](const std::string& line) { return line.substr(line.rfind(' ') + 1); };
  std::string first = tokenOf(lines[lines.size() - 2]);
  std::string second = tokenOf(lines.back());
  EXPECT_EQ(first.size(), 32u);
  EXPECT_NE(first, second);

  ExtensionHandle consumed = ExtensionTokens::shared().consume(first);
  ASSERT_TRUE(consumed);
  EXPECT_EQ(consumed.user, ::getuid());
  EXPECT_EQ(::write(consumed.descriptor.get(), "x", 1), 1);
  char byte = 0;
  EXPECT_EQ(::read(readEnd.get(), &byte, 1), 1);
  EXPECT_FALSE(ExtensionTokens::shared().consume(first));

  service.listener().stop();
  EXPECT_FALSE(ExtensionTokens::shared().consume(second)) << "it went with the connection";
}

TEST(IPCConnection, ServesWhatAClientSentBeforeItLeftItsAnswersUnread) {
  TestService service;
  {
    TestClient client(service);
    ASSERT_EQ(client.call("flushMessagesWithReply"), "posted all");
    for (int i = 0; i < 300; ++i) {
      ASSERT_EQ(
          client.bus().send(
              {wire::kSessionInterface, "sendMessageWithDictionary", message(i)}, [](BusAnswer&) {}, 25s),
          BusClient::SendResult::Sent);
    }
  }
  EXPECT_TRUE(service.journal.waitFor("destroyed"));
  EXPECT_EQ(service.journal.count("message"), 300u);
  const std::size_t before = service.journal.count("interrupted");
  EXPECT_EQ(TestClient(service).call("flushMessagesWithReply"), "posted all");
  EXPECT_TRUE(service.journal.waitFor("destroyed", 2));
  EXPECT_EQ(service.journal.count("interrupted"), before) << "a client that has read them just hangs up";
  EXPECT_EQ(*(service.journal.lines().end() - 2), "invalidated") << "and only then is destroyed";
}

TEST(IPCConnection, MayBeInvalidatedFromItsOwnHandlerAndTwice) {
  TestService service;
  TestClient client(service);
  auto connection = service.connection();
  service.onInvalidation = [&] { connection->invalidate(); };
  connection->invalidate();
  connection->invalidate();
  EXPECT_TRUE(client.runToEnd());
  EXPECT_TRUE(service.journal.waitFor("destroyed"));
  EXPECT_EQ(service.journal.count("invalidated"), 1u);
  std::string error;
  connection->callRemoteObject({"i.f", "m", {}}, [&](const std::string& text) { error = text; });
  EXPECT_FALSE(error.empty());
}

TEST(IPCConnection, GivesTheClientTheLastWordOfASessionThatIsSentAway) {
  TestService service;
  TestClient client(service);
  EXPECT_EQ(client.call("sendMessageWithDictionary", message(1, "farewell")), "1");
  std::thread stopping([&] { service.listener().stop(); });
  EXPECT_TRUE(client.runToEnd());
  stopping.join();
  EXPECT_EQ(client.received, (std::vector<std::string>{"sendMessageToClient none 0 0 0 none"}));
  EXPECT_EQ(service.journal.lines().back(), "destroyed");
}

TEST(IPCListener, DoesNotWaitForEverForAHandlerThatHangs) {
  TestService service;
  std::promise<void> released;
  service.onInvalidation = [&] { released.get_future().wait(); };
  TestClient client(service);
  EXPECT_EQ(client.call("flushMessagesWithReply"), "posted all");
  EXPECT_FALSE(service.listener().stopWithin(10ms));
  released.set_value();
  EXPECT_TRUE(service.listener().stopWithin(60s));
  EXPECT_EQ(service.listener().connectionCount(), 0u);
}

TEST(IPCListener, ServesAnInheritedSocketAndAPathLongerThanAnAddress) {
  TempDirectory directory;
  const std::string path = directory / std::string(120, 'd') / "socket";
  {
    TestService service([&](IPCListener::Options& options) {
      options.socketPath = path;
      options.inherited = listenOnUnixSocket(path);
    });
    TestClient client(service);
    EXPECT_EQ(client.call("flushMessagesWithReply"), "posted all");
  }
  EXPECT_TRUE(std::filesystem::exists(path)) << "it is the service manager's";
}

}  // namespace
}  // namespace vesk::test
