#include "tools/collector/EventText.h"

#include <cstdio>
#include <ctime>

#include "platform/json/JSONWriter.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

constexpr std::size_t kShownOfAValue = 500;  // bytes

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

}  // namespace

std::string clockText(WallTime time) {
  timeval value = timevalFrom(time);
  std::tm local{};
  ::localtime_r(&value.tv_sec, &local);
  char text[32];
  std::size_t length = std::strftime(text, sizeof text, "%H:%M:%S", &local);
  std::snprintf(text + length, sizeof text - length, ".%03ld", static_cast<long>(value.tv_usec / 1000));
  return text;
}

double secondsFrom(WallTime time) { return std::chrono::duration<double>(time.time_since_epoch()).count(); }

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

}  // namespace vesk
