// What broken or malicious clients can do to the daemon and to other clients.
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <thread>

#include "tests/support/CapturedLog.h"
#include "tests/support/IPCHarness.h"
#include "tests/support/ProcessFacts.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;
using namespace std::string_literals;

std::vector<IPCArgument> message(int number) { return {Dictionary{{"n", number}}}; }

std::string hexOf(uid_t user) {
  std::string hex;
  for (char digit : std::to_string(user)) hex += std::string("3") + digit;
  return hex;
}

TEST(IPCLimits, ClosesWhatIsNoAuthentication) {
  std::string many(1, '\0');
  for (int i = 0; i < 100; ++i) many += "AUTH\r\n";
  const std::string cases[] = {
      "GET / HTTP/1.1\r\n\r\n", "\0"s + std::string(100'000, 'x'), "\0"s + std::string(2000, 'x') + "\r\n",
      "\0BEGIN\r\n"s,           "\0AUTH ANONYMOUS\r\nBEGIN\r\n"s,  many};
  CapturedLog log;
  TestService service;
  for (const auto& bytes : cases) {
    RawClient client(service);
    client.send(bytes);
    EXPECT_TRUE(client.isClosed());
  }
  EXPECT_TRUE(service.journal.waitFor("destroyed", std::size(cases)));
  EXPECT_EQ(service.journal.count("interrupted"), 0u);
  EXPECT_EQ(log.countContaining(4, "ipc: connection"), std::ssize(cases));
}

TEST(IPCLimits, LetsInOnlyWhoClaimsToBeHimself) {
  TestService service;
  RawClient liar(service);
  liar.send("\0AUTH EXTERNAL "s + hexOf(::getuid() + 1) + "\r\n");
  EXPECT_EQ(liar.line(), "REJECTED EXTERNAL");
  liar.send("AUTH EXTERNAL\r\n");
  EXPECT_EQ(liar.line(), "DATA");
  liar.send("DATA " + hexOf(4294967295) + "\r\n");
  EXPECT_EQ(liar.line(), "REJECTED EXTERNAL");

  RawClient honest(service);
  for (char byte : "\0AUTH EXTERNAL "s + hexOf(::getuid()) + "\r\n") honest.send({&byte, 1});
  EXPECT_EQ(honest.line().substr(0, 3), "OK ");
}

TEST(IPCLimits, ClosesWhoDoesNotAuthenticateInTime) {
  CapturedLog log;
  TestService service([](IPCListener::Options& options) { options.authenticationTimeout = 50ms; });
  RawClient silent(service);
  RawClient slow(service);
  slow.send("\0AUTH EXTERNAL\r\n"s);
  EXPECT_TRUE(silent.isClosed());
  EXPECT_TRUE(slow.isClosed());
  EXPECT_TRUE(service.journal.waitFor("destroyed", 2));
  EXPECT_EQ(log.countContaining(4, "ipc: connection"), 2);
}

TEST(IPCLimits, ClosesConnectionsInExcessWithOneLineABurst) {
  struct Case {
    std::size_t all;
    std::size_t perUser;
    const char* line;
  };
  for (const auto& test :
       {Case{2, 256, "ipc: Refused a connection of user"}, Case{4096, 2, "ipc: Refused"}}) {
    CapturedLog log;
    TestService service([&](IPCListener::Options& options) {
      options.maximumConnections = test.all;
      options.maximumConnectionsPerUser = test.perUser;
    });
    TestClient first(service);
    auto second = std::make_unique<TestClient>(service);
    EXPECT_EQ(second->call("flushMessagesWithReply"), "posted all");
    for (int i = 0; i < 3; ++i) EXPECT_EQ(RawClient(service).line(), "ERROR too many connections");
    try {
      TestClient refused(service);
      EXPECT_TRUE(refused.runToEnd() && refused.bus().wasTurnedAway());
    } catch (const std::system_error& error) {  // refused before the connection was complete
      EXPECT_EQ(error.code().value(), EUSERS);
    }
    EXPECT_EQ(log.countContaining(4, test.line), 1);
    EXPECT_EQ(service.journal.count("accepted"), 2u);
    EXPECT_EQ(first.call("flushMessagesWithReply"), "posted all");

    second.reset();
    EXPECT_TRUE(service.journal.waitFor("destroyed"));
    while (service.listener().connectionCount() > 1) std::this_thread::yield();
    TestClient third(service);
    EXPECT_EQ(third.call("flushMessagesWithReply"), "posted all") << "room again";
  }
}

const std::string kFlush = wireMessage("flushMessagesWithReply", "", "");

std::string bytesMessage(std::size_t size, int depth = 0) {
  return wireMessage("sendMessageWithDictionary", "a{sv}", RawClient::bytesDictionary(size, depth));
}

/// One key with a list of empty texts.
std::string textsMessage(int count) {
  Marshalled texts(false), entry(false), body(false);
  for (int i = 0; i < count; ++i) texts.text("");
  entry.text("k");
  entry.signature("as");
  const std::string list = texts.take();
  entry.number(static_cast<std::uint32_t>(list.size()));
  entry.raw(list);
  const std::string entries = entry.take();
  body.number(static_cast<std::uint32_t>(entries.size()));
  body.align(8);
  body.raw(entries);
  return wireMessage("sendMessageWithDictionary", "a{sv}", body.take());
}

constexpr std::size_t kMessage = std::size_t{1} << 20;

TEST(IPCLimits, TakesMessagesUpToTheLimit) {
  TestService service;
  RawClient client(service);
  client.authenticate();
  // Content: 8 bytes each for dictionary and value, and a key of one letter.
  client.send(bytesMessage(kMessage - 17));
  // The dictionary and the list also count.
  client.send(textsMessage(99'998));
  EXPECT_TRUE(service.journal.waitFor("message", 2));
  client.send(textsMessage(99'999));
  client.send(bytesMessage(kMessage - 16));
  client.send(bytesMessage(1, 100));
  client.send(wireMessage("flushMessagesWithReply", "", "", {.bigEndian = true}));
  EXPECT_TRUE(service.journal.waitFor("flush")) << "the connection goes on";
  EXPECT_EQ(service.journal.count("message"), 2u);
}

TEST(IPCLimits, ClosesWhoSendsNoMessagesOrOneOverTheLimit) {
  std::string noVersion = kFlush;
  noVersion[3] = 2;
  for (const auto& bytes :
       {"this is no D-Bus message"s, std::string(64, '\0'), noVersion, bytesMessage(3 * kMessage)}) {
    CapturedLog log;
    TestService service;
    RawClient client(service);
    client.authenticate();
    client.send(kFlush + bytes);
    EXPECT_TRUE(client.isClosed());
    EXPECT_TRUE(service.journal.waitFor("destroyed"));
    EXPECT_EQ(service.journal.lines(),
              (std::vector<std::string>{"accepted", "flush", "interrupted", "invalidated", "destroyed"}));
    EXPECT_EQ(log.countContaining(4, "ipc: connection"), 1);
  }
}

TEST(IPCLimits, DropsWhatIsBrokenInsideWithOneLineABurst) {
  const std::string notUTF8("\1\0\0\0\xff\0\0\0\0\0\0\0", 12);
  for (const auto& broken :
       {wireMessage("uploadFileAtPath", "sah", notUTF8),
        wireMessage("no member", "", "") + wireMessage("fetchDisplayURL", "no signature", "")}) {
    CapturedLog log;
    TestService service;
    RawClient client(service);
    client.authenticate();
    client.send(broken + kFlush);
    EXPECT_TRUE(service.journal.waitFor("flush")) << "the connection goes on";
    client.close();
    EXPECT_TRUE(service.journal.waitFor("destroyed"));
    EXPECT_EQ(service.journal.count("upload") + service.journal.count("fetchDisplayURL"), 0u);
    EXPECT_EQ(log.countContaining(4, "ipc: connection"), 1);
  }
}

TEST(IPCLimits, AClientThatDiesAtAnyByteOfAMessageDisturbsNobody) {
  TestService service;
  TestClient other(service);
  EXPECT_EQ(other.call("sendMessageWithDictionary", message(1)), "1");
  const std::string bytes = bytesMessage(20);
  const std::size_t cuts = bytes.size() - 1;
  for (std::size_t size = 1; size <= cuts; ++size) {
    RawClient dying(service);
    dying.authenticate();
    dying.send(std::string_view(bytes).substr(0, size));
  }
  EXPECT_TRUE(service.journal.waitFor("destroyed", cuts));
  EXPECT_EQ(service.journal.count("interrupted"), cuts);
  EXPECT_EQ(service.journal.count("message"), 1u) << "no half message";
  EXPECT_EQ(other.call("sendMessageWithDictionary", message(2)), "2");
}

TEST(IPCLimits, StopsReadingFromAClientThatDoesNotReadItsAnswers) {
  TestService service;
  TestClient client(service);
  TestClient other(service);
  ASSERT_EQ(client.call("flushMessagesWithReply"), "posted all");
  std::size_t answered = 0;
  std::size_t sent = 0;
  auto count = [&](BusAnswer& answer) { answered += answer.isError() ? 0 : 1; };
  const IPCOutgoingCall ask{wire::kSessionInterface,
                            "sendMessageWithDictionary",
                            {Dictionary{{"pad", 20'000}, {"x", std::string(20'000, 'x')}}}};
  // Sends until the daemon accepts no more and the client's own messages pile up in its queue.
  while (client.bus().queuedMessages() < 20 && sent < 20'000) {
    ASSERT_EQ(client.bus().send(ask, count, 60s), BusClient::SendResult::Sent);
    ++sent;
  }
  EXPECT_EQ(client.bus().queuedMessages(), 20u);
  EXPECT_EQ(other.call("fetchDisplayURL"), "https://display.example/") << "others do not notice";
  const std::size_t served = service.journal.count("message");
  EXPECT_LT(served, sent);
  EXPECT_TRUE(client.runUntil([&] { return answered == sent; })) << "nothing is lost";
}

TEST(IPCLimits, TellsTheCallerWhenAClientsOutboxIsFull) {
  TestService service;
  std::optional<TestClient> client(std::in_place, service);
  ASSERT_EQ(client->call("flushMessagesWithReply"), "posted all");
  auto connection = service.connection();
  std::string error;
  const auto errorOf = [&](std::string text) {
    error.clear();
    connection->callRemoteObject({wire::kReplyInterface, "sendMessageToClient", {std::move(text)}},
                                 [&](const std::string& why) { error = why; });
    return error;
  };
  // The sockets hold some 500 KiB, so less than one call, and the outbox 4 MiB.
  for (int i = 0; i < 10 && error.empty(); ++i) errorOf(std::string(900'000, 'x'));
  EXPECT_EQ(error, "too many calls wait for the client");
  EXPECT_EQ(errorOf(std::string(kMessage + 1, 'x')), "the call is too large");
  EXPECT_EQ(errorOf("\xff"), "the arguments are malformed");
  client.reset();
  EXPECT_TRUE(service.journal.waitFor("lost ")) << "and what became of those that it took";
}

void sendWithDescriptors(int socket, const std::string& bytes, std::size_t count) {
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * 16)] = {};
  iovec piece{const_cast<char*>(bytes.data()), bytes.size()};
  msghdr header{};
  header.msg_iov = &piece;
  header.msg_iovlen = 1;
  header.msg_control = control;
  header.msg_controllen = CMSG_SPACE(sizeof(int) * count);
  cmsghdr* rights = CMSG_FIRSTHDR(&header);
  rights->cmsg_level = SOL_SOCKET;
  rights->cmsg_type = SCM_RIGHTS;
  rights->cmsg_len = CMSG_LEN(sizeof(int) * count);
  ASSERT_EQ(::sendmsg(socket, &header, MSG_NOSIGNAL), static_cast<ssize_t>(bytes.size()));
}

std::string upload(WireHeader header, const char* member = "uploadFileAtPath") {
  // "file", and an array with descriptor 0.
  return wireMessage(member, "sah", std::string("\4\0\0\0file\0\0\0\0\4\0\0\0\0\0\0\0", 20), header);
}

TEST(IPCLimits, ClosesWhoSendsDescriptorsThatNoCallTakes) {
  const std::string good = upload({.descriptors = 1});
  struct Case {
    const char* what;
    std::string before;  // sent without descriptors
    std::string bytes;
    std::size_t descriptors = 1;
  };
  const Case cases[] = {
      {"UNIX_FDS missing", "", upload({})},
      {"fewer declared", "", good, 2},
      {"more than any call may have", "", kFlush, 5},
      {"a call that takes none", "", wireMessage("flushMessagesWithReply", "", "", {.descriptors = 1})},
      {"an invalid member", "", upload({.descriptors = 1}, "no member")},
      {"a large call", "",
       wireMessage("uploadFileAtPath", "sah", std::string(20'000, 'x'), {.descriptors = 1})},
      {"within a message", kFlush + kFlush.substr(0, 40), kFlush.substr(40)},
  };
  constexpr int kTimes = 8;
  CapturedLog log;
  TestService service;
  TestClient other(service);
  EXPECT_EQ(other.call("flushMessagesWithReply"), "posted all");
  const ProcessFacts self(::getpid());
  const std::size_t before = self.descriptors();
  for (const Case& test : cases) {
    for (int i = 0; i < kTimes; ++i) {
      RawClient client(service);
      client.authenticate();
      client.send(test.before);
      if (!test.before.empty())
        while (service.journal.count("flush") < static_cast<std::size_t>(i) + 2) std::this_thread::yield();
      sendWithDescriptors(client.fd(), test.bytes, test.descriptors);
      ASSERT_TRUE(client.isClosed()) << test.what;
    }
  }
  RawClient early(service);
  sendWithDescriptors(early.fd(), "\0AUTH EXTERNAL\r\n"s, 1);
  EXPECT_TRUE(early.isClosed());
  RawClient cut(service);
  cut.authenticate();
  sendWithDescriptors(cut.fd(), good.substr(0, good.size() - 1), 1);
  for (auto* client : {&early, &cut}) client->close();
  const std::size_t ended = std::size(cases) * kTimes + 2;
  EXPECT_TRUE(service.journal.waitFor("destroyed", ended));
  EXPECT_EQ(log.countContaining(4, ": Closed: "), static_cast<long>(ended) - 1);
  EXPECT_EQ(service.journal.count("upload"), 0u);
  EXPECT_TRUE(eventually([&] { return self.descriptors() <= before; })) << self.descriptors() - before;
  EXPECT_EQ(other.call("flushMessagesWithReply"), "posted all");
}

TEST(IPCLimits, GivesADescriptorToTheMessageThatItCameWith) {
  const std::string call = upload({.descriptors = 1});
  TestService service;
  RawClient client(service);
  client.send("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\n"s);
  for (int i = 0; i < 3; ++i) client.line();
  // The daemon may read them together or separately.
  client.send("BEGIN\r\n" + kFlush);
  for (int i = 0; i < 20; ++i) {
    sendWithDescriptors(client.fd(), call, 1);
    client.send(kFlush);
  }
  // In two pieces, the first shorter than a header.
  sendWithDescriptors(client.fd(), call.substr(0, 10), 1);
  EXPECT_TRUE(service.journal.waitFor("flush", 21));
  client.send(call.substr(10));
  EXPECT_TRUE(service.journal.waitFor("upload", 21));
  for (const auto& line : service.journal.lines()) {
    if (!line.starts_with("upload")) continue;
    EXPECT_EQ(line.size(), std::string("upload file ").size() + 32) << line;
  }
}

}  // namespace
}  // namespace vesk::test
