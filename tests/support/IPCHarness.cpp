#include "tests/support/IPCHarness.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>

#include "platform/ipc/IPCIncomingCall.h"
#include "platform/ipc/UnixSocket.h"
#include "protocol/ClientSessionReplyProxy.h"
#include "protocol/ClientSessionStub.h"

namespace vesk::test {

using namespace std::chrono_literals;
using namespace std::string_view_literals;

// --- ActingSession

ActingSession::~ActingSession() {
  if (_saysFarewell) {
    ClientSessionReplyProxy proxy(_connection,
                                  [this](const std::string& error) { _record.add("lost: " + error); });
    proxy.sendMessageToClient(std::nullopt, 0, 0, 0, std::nullopt);
  }
  _record.add("destroyed");
}

void ActingSession::sendMessageWithDictionary(const Dictionary& parameters,
                                              Reply<std::optional<std::string>> reply) {
  const std::string action = parameters.text("do").value_or(Text()).string();
  const std::string number = std::to_string(integerForKey(parameters, "n").value_or(0));
  if (action == "farewell") _saysFarewell = true;
  _record.add("message " + number);
  if (action == "throw") throw std::runtime_error("thrown");
  const auto padding = static_cast<std::size_t>(integerForKey(parameters, "pad").value_or(0));
  if (action != "abandon" && reply) reply(number + std::string(padding, '.'));
}

void ActingSession::uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                                     Reply<bool> completionHandler) {
  _record.add("upload " + fileURL + " " + extensionToken);
  completionHandler(true);
}

// --- TestService

TestService::TestService(const std::function<void(IPCListener::Options&)>& adjust) {
  IPCListener::Options options;
  options.socketPath = _directory / "run/socket";
  options.objectPath = wire::kObjectPath;
  if (adjust) adjust(options);
  _path = options.socketPath;
  _listener = std::make_unique<IPCListener>(std::move(options));
  _listener->setDelegate(this);
  _listener->resume();
}

bool TestService::shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) {
  auto session = std::make_shared<ActingSession>(journal, connection);
  IPCHandlers handlers{.object = std::make_shared<ClientSessionStub>(session),
                       .interruption = [this, session] { journal.add("interrupted"); },
                       .invalidation =
                           [this, session] {
                             journal.add("invalidated");
                             if (onInvalidation) onInvalidation();
                           },
                       .loss = [this](std::size_t calls) { journal.add("lost " + std::to_string(calls)); }};
  {
    std::lock_guard lock(_mutex);
    _connections.push_back(connection);
  }
  journal.add("accepted");
  connection->resume(std::move(handlers));
  return true;
}

std::shared_ptr<IPCConnection> TestService::connection(std::size_t index) {
  EXPECT_TRUE(journal.waitFor("accepted", index + 1));
  std::lock_guard lock(_mutex);
  return _connections.at(index).lock();
}

// --- TestClient

TestClient::TestClient(const TestService& service) : TestClient(service.path()) {}

TestClient::TestClient(const std::string& socketPath) {
  BusClient::Options options;
  options.socketPath = socketPath;
  options.objectPath = wire::kObjectPath;
  _bus = std::make_unique<BusClient>(std::move(options));
  _bus->setExportedObject(_self);
}

void TestClient::handle(IPCIncomingCall& call) {
  std::optional<Dictionary> sessionInfo;
  std::optional<Dictionary> payload;
  double timestamp = 0;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  if (!call.read(wire::kSendMessageToClient.arguments, sessionInfo, timestamp, category, type, payload))
    return;
  received.push_back(std::string(call.member()) + " " + shown(sessionInfo) + " " + describe(timestamp) + " " +
                     std::to_string(category) + " " + std::to_string(type) + " " + shown(payload));
  call.answer();
}

bool TestClient::runUntil(const std::function<bool()>& predicate) {
  const auto deadline = std::chrono::steady_clock::now() + 30s;
  while (!predicate()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    pollfd poll{_bus->fd(), _bus->events(), 0};
    int timeout = _bus->timeout();
    ::poll(&poll, 1, timeout < 0 ? 20 : std::min(timeout, 20));
    if (_bus->process() == BusClient::Progress::Disconnected) return predicate();
  }
  return true;
}

bool TestClient::runToEnd() {
  runUntil([] { return false; });
  return _bus->process() == BusClient::Progress::Disconnected;
}

std::string TestClient::call(const char* member, std::vector<IPCArgument> arguments,
                             const char* interfaceName) {
  std::string result;
  auto handler = [&result, member](BusAnswer& answer) {
    bool flag = false;
    std::string text;
    std::optional<std::string> perhaps;
    std::optional<std::vector<std::string>> names;
    std::string_view name(member);
    if (answer.isError()) {
      result = answer.errorName().substr(answer.errorName().rfind('.') + 1);
    } else if (name.starts_with("upload")) {
      result = !answer.read(flag) ? "unreadable" : flag ? "true" : "false";
    } else if (name.starts_with("start")) {
      result = !answer.read(names) ? "unreadable" : names ? names->at(0) + "," + names->at(1) : "absent";
    } else if (name == "fetchDisplayURL" || name == "Introspect") {
      result = answer.read(text) ? text : "unreadable";
    } else if (name == "setSessionInfo" || name == "Ping") {
      result = "done";
    } else {
      result = answer.read(perhaps) ? perhaps.value_or("absent") : "unreadable";
    }
  };
  auto sent = _bus->send({interfaceName, member, std::move(arguments)}, handler, 25s);
  if (sent != BusClient::SendResult::Sent) return "not sent";
  EXPECT_TRUE(runUntil([&] { return !result.empty(); })) << member;
  return result;
}

void TestClient::post(const char* member, std::vector<IPCArgument> arguments) {
  EXPECT_EQ(_bus->send({wire::kSessionInterface, member, std::move(arguments)}), BusClient::SendResult::Sent);
}

// --- RawClient

RawClient::RawClient(const std::string& socketPath) : _socket(connectUnixSocket(socketPath)) {}

void RawClient::send(std::string_view bytes) {
  while (!bytes.empty()) {
    ssize_t sent = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (sent >= 0) {
      bytes.remove_prefix(static_cast<std::size_t>(sent));
      continue;
    }
    pollfd poll{_socket.get(), POLLOUT, 0};
    if (errno != EAGAIN || ::poll(&poll, 1, 30'000) <= 0) return;  // the connection was refused while sending
  }
}

std::string RawClient::line() {
  std::string text;
  for (;;) {
    char next = 0;
    pollfd poll{_socket.get(), POLLIN, 0};
    if (::poll(&poll, 1, 30'000) <= 0 || ::recv(_socket.get(), &next, 1, 0) != 1) return {};
    if (next == '\n') return text.substr(0, text.size() - 1);
    text += next;
  }
}

void RawClient::authenticate() {
  send("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\n"sv);
  EXPECT_EQ(line(), "DATA");
  EXPECT_EQ(line().substr(0, 3), "OK ");
  EXPECT_EQ(line(), "AGREE_UNIX_FD");
  send("BEGIN\r\n");
}

bool RawClient::isClosed() {
  char buffer[4096];
  for (;;) {
    pollfd poll{_socket.get(), POLLIN, 0};
    if (::poll(&poll, 1, 30'000) <= 0) return false;
    if (::recv(_socket.get(), buffer, sizeof buffer, 0) <= 0) return true;
  }
}

std::string RawClient::bytesDictionary(std::size_t size, int depth) {
  Marshalled entry(false);  // starts at a multiple of 8
  entry.text("k");
  entry.signature("ay");
  entry.number(static_cast<std::uint32_t>(size));
  entry.raw(std::string(size, 'x'));
  std::string bytes = entry.take();
  for (; depth > 0; --depth) {
    Marshalled outer(false);
    outer.text("k");
    outer.signature("a{sv}");
    outer.number(static_cast<std::uint32_t>(bytes.size()));
    outer.align(8);
    outer.raw(bytes);
    bytes = outer.take();
  }
  Marshalled body(false);
  body.number(static_cast<std::uint32_t>(bytes.size()));
  body.align(8);
  body.raw(bytes);
  return body.take();
}

}  // namespace vesk::test
