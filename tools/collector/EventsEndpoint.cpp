#include "tools/collector/EventsEndpoint.h"

#include <cmath>
#include <cstring>
#include <utility>

#include "platform/json/JSONWriter.h"
#include "platform/time/Clock.h"
#include "tools/files/WholeFile.h"
#include "tools/json/JSONReader.h"
#include "tools/text/Printable.h"

namespace vesk {

/// One post, as the daemon sends it.
struct EventPost {
  double postTime = 0;  ///< seconds since 1970
  std::string clientId;
  List events;               ///< at least one; each a flat dictionary of text, numbers and booleans
  std::size_t jsonSize = 0;  ///< bytes of the decompressed body
};

namespace {

constexpr std::size_t kShownOfAValue = 500;  // bytes

[[noreturn]] void refuse(std::string reason) { throw Refusal{400, std::move(reason)}; }

std::string quoted(std::string_view text) { return "'" + std::string(text.substr(0, 80)) + "'"; }

bool isAllOf(std::string_view text, std::string_view characters) {
  return !text.empty() && text.find_first_not_of(characters) == std::string_view::npos;
}

void checkMediaType(const HTTPReceived& received, const char* name) {
  auto value = received.header(name);
  if (!value) refuse(std::string("the header ") + name + " is missing: it must be application/json");
  if (*value != "application/json")
    refuse(std::string("the header ") + name + " must be application/json, not " + quoted(*value));
}

void checkHeaders(const HTTPReceived& received) {
  checkMediaType(received, "Content-Type");
  checkMediaType(received, "Accept");
  if (!received.header("Content-Length")) refuse("the header Content-Length is missing");
  if (auto sender = received.header("X-Vesk-Sender"))
    if (!isAllOf(*sender, "ABCDEFGHIJKLMNOPQRSTUVWXYZ") || sender->size() < 2 || sender->size() > 3)
      refuse("X-Vesk-Sender must be two or three capital letters, not " + quoted(*sender));
  if (auto build = received.header("X-Vesk-Internal-Build"); build && *build != "1")
    refuse("X-Vesk-Internal-Build must be 1, not " + quoted(*build));
}

void checkEventMap(const HTTPReceived& received, std::size_t events) {
  auto map = received.header("X-Vesk-Event-Map");
  if (!map) return;
  constexpr std::string_view kDigits = "0123456789";
  auto blank = map->find(' ');
  if (!isAllOf(map->substr(0, blank), kDigits) || blank == std::string_view::npos ||
      !isAllOf(map->substr(blank + 1), kDigits))
    refuse("X-Vesk-Event-Map must be two numbers with a blank between, not " + quoted(*map));
  if (events != 1) refuse("X-Vesk-Event-Map stands on a post of " + std::to_string(events) + " events");
}

/// JSON can't represent a number beyond the range of a double, so it could be neither saved nor shown.
bool isTooLarge(const Value& value) {
  const double* number = value.real();
  return number != nullptr && !std::isfinite(*number);
}

void checkEvent(const Value& value, std::size_t index) {
  std::string place = "events[" + std::to_string(index) + "]";
  const Dictionary* event = value.dictionary();
  if (event == nullptr) refuse(place + " must be an object");
  for (const auto& [key, entry] : *event) {
    if (!entry.isNumber() && entry.text() == nullptr)
      refuse(place + "." + key.string() + " must be a text or a number, is " + describe(entry, 60));
    if (isTooLarge(entry)) refuse(place + "." + key.string() + " is too large a number");
  }
}

EventPost readBody(const std::string& json) {
  const auto parsed = parseJSON(json);
  if (!parsed) refuse("the body is no JSON: " + parsed.error().text);
  const Dictionary* body = parsed->dictionary();
  if (body == nullptr) refuse("the body must be a JSON object");
  for (const auto& [key, value] : *body)
    if (key != "postTime" && key != "clientId" && key != "events")
      refuse("the body holds the unknown key " + quoted(key.view()));

  const Value* postTime = body->find("postTime");
  if (postTime == nullptr || !postTime->isNumber() || postTime->boolean() != nullptr)
    refuse("the body must hold the number postTime");
  if (isTooLarge(*postTime)) refuse("postTime is too large a number");
  auto clientId = body->text("clientId");
  if (!clientId) refuse("the body must hold the text clientId");
  auto events = body->list("events");
  if (!events || events->empty()) refuse("the body must hold the array events, with one event at least");
  for (std::size_t i = 0; i < events->size(); ++i) checkEvent((*events)[i], i);
  return {*postTime->asDouble(), clientId->string(), *events, json.size()};
}

Dictionary headersOf(const HTTPReceived& received) {
  MutableDictionary headers;
  for (const auto& [name, value] : received.headers) {
    const Value* earlier = headers.find(name);
    std::string joined =
        earlier != nullptr ? earlier->text()->string() + ", " + printableUTF8(value) : printableUTF8(value);
    headers.set(printableUTF8(name), joined);
  }
  return headers.share();
}

std::string sizeText(const EventPost& post, const HTTPReceived& received) {
  std::string size = std::to_string(received.body.size()) + " bytes";
  if (received.header("Content-Encoding")) size += " gzip of " + std::to_string(post.jsonSize) + " bytes";
  return size;
}

std::string titleOf(const Dictionary& event) {
  std::string title = "event";
  for (auto [key, words] :
       {std::pair{"_eventNumber", " number "}, {"_method", " method "}, {"_status", " status "}})
    if (const Value* value = event.find(key)) title.append(words).append(printable(describe(*value, 40)));
  return title;
}

/// A hash of what identifies an event within a post URL; nullopt if the event lacks some of it.
std::optional<std::uint64_t> keyOf(const std::string& url, const Dictionary& event) {
  std::vector<Value> parts{printableUTF8(url)};
  for (const char* key : {"_sessionID", "_eventNumber", "_method", "_status", "_clientTS"}) {
    const Value* part = event.find(key);
    if (part == nullptr) return std::nullopt;
    parts.push_back(*part);
  }
  const auto text = toJSON(List(std::move(parts)), JSONStyle::Compact);
  return text ? std::optional(std::hash<std::string>{}(*text)) : std::nullopt;
}

/// Checks all of the protocol's requirements: headers, encoding and the shape of the JSON body.
EventPost readEventPost(const HTTPReceived& received) {
  checkHeaders(received);
  HTTPReceived::Decoded decoded = received.decodedBody();
  if (!decoded.body) refuse(decoded.problem);
  EventPost post = readBody(*decoded.body);
  checkEventMap(received, post.events.size());
  return post;
}

/// One line for the post, then its X-Vesk headers, then each event with its entries. No final line feed, and
/// no other control characters than line feeds.
std::string readableText(const EventPost& post, const HTTPReceived& received, WallTime now) {
  std::size_t count = post.events.size();
  std::string text = clockText(now) + " " + std::to_string(count) + (count == 1 ? " event" : " events") +
                     " in " + printable(received.method + " " + received.target.substr(0, 200)) + " from " +
                     received.peer + ", " + sizeText(post, received) + ", clientId " +
                     printable(post.clientId);
  for (const auto& [name, value] : received.headers)
    if (name.starts_with("X-Vesk-")) text += "\n  " + printable(name) + ": " + printable(value);
  for (const Value& item : post.events) {
    text += "\n  " + titleOf(*item.dictionary());
    for (const auto& [key, value] : *item.dictionary())
      text += "\n    " + printable(key.view()) + " = " + printable(describe(value, kShownOfAValue));
  }
  return text;
}

/// One line per event, with its line feed.
std::string jsonLines(const EventPost& post, const HTTPReceived& received, WallTime now) {
  Dictionary headers = headersOf(received);
  std::string lines;
  for (const Value& event : post.events) {
    auto line = toJSON(Dictionary{{"received", secondsFrom(now)},
                                  {"peer", received.peer},
                                  {"path", printableUTF8(received.target)},
                                  {"headers", headers},
                                  {"postTime", post.postTime},
                                  {"clientId", post.clientId},
                                  {"event", event}},
                       JSONStyle::Compact);
    if (line) lines.append(*line).append("\n");
  }
  return lines;
}

}  // namespace

HTTPAnswer EventsEndpoint::serve(const HTTPReceived& received, const CollectorFault*) {
  requireMethod(received, "POST");
  EventPost post = readEventPost(received);
  const std::size_t count = post.events.size();
  // Held while the events are saved: if that fails, a repetition that arrives meanwhile must not be left out.
  MutexLock lock(_mutex);
  const auto keys = takeNewEvents(post, received.target);
  if (!post.events.empty() && !record(post, received)) {
    for (std::uint64_t key : keys) _taken.at(key) = false;
    // The sender keeps an unanswered post and sends it again. After a 4xx it would drop the post, and after a
    // 5xx it would stop posting.
    return {.fault = HTTPAnswer::Fault::CloseWithoutAnswer};
  }
  ++_stats.posts;
  _stats.events += post.events.size();
  if (const std::size_t repeated = count - post.events.size()) {
    _stats.eventsRepeated += repeated;
    _console.note(describeRequest(received) + ": left out " + std::to_string(repeated) +
                  (repeated == 1 ? " event that has" : " events that have") + " come before");
  }
  return HTTPAnswer::of("application/json", "{\"accepted\":" + std::to_string(count) + "}\n");
}

std::vector<std::uint64_t> EventsEndpoint::takeNewEvents(EventPost& post, const std::string& url) {
  std::vector<std::uint64_t> keys;
  std::vector<Value> events;
  for (const Value& event : post.events) {
    if (const auto key = keyOf(url, *event.dictionary())) {
      if (std::exchange(_taken.at(*key), true)) continue;
      keys.push_back(*key);
    }
    events.push_back(event);
  }
  post.events = List(std::move(events));
  return keys;
}

bool EventsEndpoint::record(const EventPost& post, const HTTPReceived& received) {
  const WallTime now = WallClock::system().now();
  std::string lines = jsonLines(post, received, now);
  if (const int error = appendLines(_file, lines)) {
    _stats.eventsNotSaved += post.events.size();
    _console.problem("can't save " + std::to_string(post.events.size()) + " events to " + _file.string() +
                     ", closing the connection without an answer: " + std::strerror(error));
    return false;
  }
  lines.pop_back();
  _console.event(_console.style() == Console::Style::JSON ? lines : readableText(post, received, now));
  return true;
}

}  // namespace vesk
