#include "tools/collector/EventPost.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>

#include "tools/json/JSONReader.h"

namespace vesk {

namespace {

/// The reason for refusing a request. Used only in this file.
struct Refusal : std::runtime_error {
  using std::runtime_error::runtime_error;
};

std::string quoted(std::string_view text) { return "'" + std::string(text.substr(0, 80)) + "'"; }

bool isAll(std::string_view text, bool (*test)(char)) {
  return !text.empty() && std::all_of(text.begin(), text.end(), test);
}
bool isDigit(char c) { return c >= '0' && c <= '9'; }
bool isUpper(char c) { return c >= 'A' && c <= 'Z'; }

void checkMediaType(const HTTPReceived& received, const char* name) {
  auto value = received.header(name);
  if (!value) throw Refusal(std::string("the header ") + name + " is missing: it must be application/json");
  if (*value != "application/json")
    throw Refusal(std::string("the header ") + name + " must be application/json, not " + quoted(*value));
}

void checkHeaders(const HTTPReceived& received) {
  checkMediaType(received, "Content-Type");
  checkMediaType(received, "Accept");
  if (!received.header("Content-Length")) throw Refusal("the header Content-Length is missing");
  if (auto sender = received.header("X-Vesk-Sender"))
    if (!isAll(*sender, isUpper) || sender->size() < 2 || sender->size() > 3)
      throw Refusal("X-Vesk-Sender must be two or three capital letters, not " + quoted(*sender));
  if (auto build = received.header("X-Vesk-Internal-Build"); build && *build != "1")
    throw Refusal("X-Vesk-Internal-Build must be 1, not " + quoted(*build));
}

void checkEventMap(const HTTPReceived& received, std::size_t events) {
  auto map = received.header("X-Vesk-Event-Map");
  if (!map) return;
  auto blank = map->find(' ');
  if (!isAll(map->substr(0, blank), isDigit) || blank == std::string_view::npos ||
      !isAll(map->substr(blank + 1), isDigit))
    throw Refusal("X-Vesk-Event-Map must be two numbers with a blank between, not " + quoted(*map));
  if (events != 1)
    throw Refusal("X-Vesk-Event-Map stands on a post of " + std::to_string(events) + " events");
}

/// JSON can't represent a number beyond the range of a double, so it could be neither saved nor shown.
bool isTooLarge(const Value& value) {
  const double* number = value.real();
  return number != nullptr && !std::isfinite(*number);
}

void checkEvent(const Value& value, std::size_t index) {
  std::string place = "events[" + std::to_string(index) + "]";
  const Dictionary* event = value.dictionary();
  if (event == nullptr) throw Refusal(place + " must be an object");
  for (const auto& [key, entry] : *event) {
    if (!entry.isNumber() && entry.text() == nullptr)
      throw Refusal(place + "." + key.string() + " must be a text or a number, is " + describe(entry, 60));
    if (isTooLarge(entry)) throw Refusal(place + "." + key.string() + " is too large a number");
  }
}

EventPost readBody(const std::string& json) {
  const auto value = parseJSON(json);
  if (!value) throw Refusal("the body is no JSON: " + value.error().text);
  const Dictionary* body = value->dictionary();
  if (body == nullptr) throw Refusal("the body must be a JSON object");
  for (const auto& [key, value] : *body)
    if (key != "postTime" && key != "clientId" && key != "events")
      throw Refusal("the body holds the unknown key " + quoted(key.view()));

  const Value* postTime = body->find("postTime");
  if (postTime == nullptr || !postTime->isNumber() || postTime->boolean() != nullptr)
    throw Refusal("the body must hold the number postTime");
  if (isTooLarge(*postTime)) throw Refusal("postTime is too large a number");
  auto clientId = body->text("clientId");
  if (!clientId) throw Refusal("the body must hold the text clientId");
  auto events = body->list("events");
  if (!events || events->empty())
    throw Refusal("the body must hold the array events, with one event at least");
  for (std::size_t i = 0; i < events->size(); ++i) checkEvent((*events)[i], i);
  return {*postTime->asDouble(), clientId->string(), *events, json.size()};
}

}  // namespace

EventPostOutcome readEventPost(const HTTPReceived& received) {
  try {
    checkHeaders(received);
    HTTPReceived::Decoded decoded = received.decodedBody();
    if (!decoded.body) return {std::nullopt, decoded.problem};
    EventPost post = readBody(*decoded.body);
    checkEventMap(received, post.events.size());
    return {std::move(post), {}};
  } catch (const Refusal& refusal) {
    return {std::nullopt, refusal.what()};
  }
}

}  // namespace vesk
