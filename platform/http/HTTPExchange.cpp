#include "platform/http/HTTPExchange.h"

#include <algorithm>
#include <exception>
#include <string>

#include "platform/log/LogUser.h"
#include "platform/log/SystemLog.h"
#include "platform/text/ASCII.h"

namespace vesk {

namespace {

bool isTokenCharacter(char c) {
  if ((c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z')) return true;
  return c != '\0' && std::string_view("!#$%&'*+-.^_`|~").find(c) != std::string_view::npos;
}

bool isSafe(const std::pair<std::string, std::string>& header) {
  const auto& [name, value] = header;
  return !name.empty() && std::all_of(name.begin(), name.end(), isTokenCharacter) &&
         std::none_of(value.begin(), value.end(), isControl);
}

std::size_t costOf(const HTTPRequest& request) {
  constexpr std::size_t kOverhead = 1024;
  std::size_t cost = kOverhead + request.url.size() + request.body.size();
  for (const auto& header : request.headers)
    cost += sizeof header + header.first.size() + header.second.size();
  return cost;
}

}  // namespace

void HTTPOutstanding::add() noexcept {
  MutexLock lock(_mutex);
  ++_count;
}

void HTTPOutstanding::remove() noexcept {
  MutexLock lock(_mutex);
  if (--_count > 0) return;
  if (_whenNone) _whenNone();
  _becameNone.notify_all();
}

bool HTTPOutstanding::waitUntilNone(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  MutexLock lock(_mutex);
  while (_count > 0) {
    if (_becameNone.wait_until(_mutex, deadline) == std::cv_status::timeout) return _count == 0;
  }
  return true;
}

HTTPExchange::HTTPExchange(HTTPRequest&& wanted, HTTPClient::Completion&& completion, Instant now,
                           HTTPOutstanding& outstanding, PostKeeper::Ticket copy)
    : request(std::move(wanted)),
      started(now),
      hasCopy(copy != 0),
      ticket(copy),
      _cost(costOf(request)),
      _user(LogUser::current()),
      _isCharged(isPost() && request.account),
      _completion(std::move(completion)),
      _outstanding(outstanding) {
  _outstanding.add();
  if (_isCharged) request.account->add(_cost);
}

HTTPExchange::~HTTPExchange() {
  if (_completion) fail({HTTPError::Kind::Other, "the client could not take the request"});
  discharge();
  _outstanding.remove();
}

std::string_view hostOfURL(std::string_view url) {
  auto scheme = url.find("://");
  if (scheme == std::string_view::npos) return url;
  return url.substr(0, url.find_first_of("/?#", scheme + 3));
}

void HTTPExchange::discharge() {
  if (std::exchange(_isCharged, false)) request.account->remove(_cost);
}

void HTTPExchange::giveUp(HTTPError error, PostKeeper* keeper, std::chrono::seconds delay) {
  if (keeper && ticket != 0) {
    keeper->sendLater(std::exchange(ticket, 0), delay);
    error.deferred = true;
  } else if (keeper && isPost()) {
    discharge();
    error.deferred = keeper->keep(std::move(request), delay);
  }
  fail(std::move(error));
}

void HTTPExchange::complete(HTTPResult result) {
  // The captures are destroyed here, still on behalf of the user.
  LogUser onBehalfOf(_user);
  auto completion = std::exchange(_completion, nullptr);
  if (completion) runCompletion(completion, std::move(result));
}

void runCompletion(const HTTPClient::Completion& completion, HTTPResult result) {
  try {
    completion(std::move(result));
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("HTTPClient: a completion failed: %s", error.what());
  } catch (...) {
    VESK_LOG_ERROR("HTTPClient: a completion failed");
  }
}

void removeUnsafeHeaders(HTTPRequest& request) {
  std::erase_if(request.headers, [](const auto& header) {
    if (isSafe(header)) return false;
    VESK_LOG_WARNING("HTTPClient: header '%s' left out: it holds characters that no header may hold",
                     header.first.c_str());
    return true;
  });
}

}  // namespace vesk
