#include <fcntl.h>
#include <unistd.h>

#include <cstring>

#include "platform/files/FileDescriptor.h"
#include "platform/files/WriteAll.h"
#include "platform/json/JSONWriter.h"
#include "protocol/WireNames.h"
#include "tools/files/Gunzip.h"
#include "tools/json/JSONReader.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DiagnosticsClient.h"

namespace vesk {

namespace {

constexpr std::size_t kLargestBody = std::size_t{64} << 20;

void askOrFail(DiagnosticsClient& daemon, const Output& output, const wire::Member& member,
               const Dictionary& request) {
  const auto answer = daemon.ask(member, {request});
  if (const auto problem = textIn(answer, "problem"); !problem.empty()) output.fail(problem);
}

void hold(DiagnosticsClient& daemon, const Output& output, bool held) {
  askOrFail(daemon, output, wire::kHoldOutbox, {{"held", held}});
}

/// The body as JSON, if it is that, and otherwise as it is.
Value readableBody(const Dictionary& post) {
  const Value* body = post.find("body");
  if (body == nullptr || body->bytes() == nullptr) return {};
  std::string text(body->bytes()->view());
  if (auto unpacked = gunzipped(text, kLargestBody)) text = *std::move(unpacked);
  if (auto parsed = parseJSON(text)) return *std::move(parsed);
  return *body;
}

/// Appends the posts to the file and makes sure that they are on disk.
void append(const FileDescriptor& file, const std::string& path, const std::vector<Dictionary>& posts,
            const Output& output) {
  std::string lines;
  for (const auto& post : posts) {
    MutableDictionary line(post);
    line.set("body", readableBody(post));
    const auto json = toJSON(line.share(), JSONStyle::Compact);
    if (!json) output.fail("post " + textIn(post, "number") + " can't be written as JSON");
    lines += *json + "\n";
  }
  auto written = writeAll(file.get(), lines);
  if (written && ::fsync(file.get()) != 0) written = systemError(errno);
  if (!written) output.fail(path + ": " + written.error().text + "; what was not written still waits");
}

int exportOutbox(DiagnosticsClient& daemon, const Invocation& invocation, const Output& output) {
  const std::string& path = invocation.output;
  const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
  if (!file) return output.failed(path + ": " + std::strerror(errno));
  const auto before = dictionaryIn(daemon.ask(wire::kGetStatus), "outbox");
  // Otherwise a post might be sent while it is written.
  const bool wasHeld = booleanForKey(before, "isHeld").value_or(false);
  if (!wasHeld) hold(daemon, output, true);
  std::uint64_t exported = 0;
  for (const auto& host : listIn(before, "hosts")) {
    const Value name = textIn(host, "host");
    for (;;) {
      const auto posts = listIn(daemon.ask(wire::kReadOutbox, {Dictionary{{"host", name}}}), "posts");
      if (posts.empty()) break;
      append(file, path, posts, output);
      askOrFail(daemon, output, wire::kRemoveFromOutbox,
                {{"host", name}, {"last", integerForKey(posts.back(), "number").value_or(0)}});
      exported += posts.size();
    }
  }
  if (!wasHeld) hold(daemon, output, false);
  return output.done(std::to_string(exported) + " posts are in " + path,
                     {{"posts", exported}, {"file", path}});
}

std::vector<std::string> linesOf(const Dictionary& outbox) {
  std::vector<std::string> lines{textIn(outbox, "posts") + " posts wait, " + textIn(outbox, "bytes") +
                                 " of at most " + textIn(outbox, "maximumBytes") + " bytes"};
  if (booleanForKey(outbox, "isHeld").value_or(false)) lines.emplace_back("held: nothing of it is sent");
  for (const auto& host : listIn(outbox, "hosts"))
    lines.push_back(textIn(host, "posts") + " for " + textIn(host, "host") + ", next attempt in " +
                    durationIn(host, "nextAttempt"));
  return lines;
}

}  // namespace

int runOutbox(const Invocation& invocation, const Output& output) {
  DiagnosticsClient daemon(invocation, output);
  if (invocation.action == "export") return exportOutbox(daemon, invocation, output);
  if (invocation.action != "show") hold(daemon, output, invocation.action == "hold");
  const auto outbox = dictionaryIn(daemon.ask(wire::kGetStatus), "outbox");
  if (outbox.empty()) return output.failed("the outbox is turned off (preference \"outbox\")");
  return output.done(linesOf(outbox), outbox);
}

}  // namespace vesk
