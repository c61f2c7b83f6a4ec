// HTTPS backends built from client entries, and the events that arrive from them.
#pragma once

#include <gtest/gtest.h>

#include "backends/BackendFactory.h"
#include "backends/https/HTTPSPostBackend.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"

namespace vesk::test {

using Lines = std::vector<std::string>;

inline timeval at(double seconds) {
  return timevalFrom(WallTime(std::chrono::microseconds(static_cast<std::int64_t>(seconds * 1e6))));
}

inline Dictionary userNamed(const char* client, const char* service = "MyCallService") {
  return {{kVeskReportingUserInfoClientName, client}, {kVeskReportingUserInfoServiceName, service}};
}

/// What a session passes to a backend.
struct Stamp {
  bool requireUserInfo = true;
  std::optional<Dictionary> userInfo = userNamed("Camera");
  bool batchEvents = false;
  bool isInternal = false;
  std::int32_t clientType = 5;
  std::string udid = "the-udid";
  std::optional<Text> build = std::nullopt;
  std::string selfVersion = "7.2.9";
  double start = 1'000'000'019.7;
  double draw = 0.30;
};

class HTTPSBackendTest : public ::testing::Test {
 protected:
  static constexpr double kStart = 1'000'000'019.7;

  /// A client entry that reports everything, with `changes` applied and without the key `without`.
  Dictionary entry(const Dictionary& changes = {}, std::string_view without = "") const {
    MutableDictionary whole(Dictionary{{"post_url", harness.url()},
                                       {"realtime_post_url", harness.url("/realtime")},
                                       {"locale_whitelist", List{"us"}},
                                       {"filters", List{Dictionary{{"key", "unused"}}}},
                                       {"sampling_threshold", 1.0}});
    whole.setAll(changes);
    whole.remove(without);
    return whole.share();
  }
  std::shared_ptr<HTTPSPostBackend> make(List clients, const Stamp& stamp = {}) {
    BackendIdentity identity{._sessionID = 4'000'000'000,
                             ._compType = stamp.clientType,
                             ._clientVersion = 3,
                             ._udid = stamp.udid,
                             ._productVersion = Text("12.1"),
                             ._buildVersion = stamp.build,
                             ._hardwareType = Text("Phone7,2"),
                             ._productFamily = Text("Phone"),
                             ._isInternal = stamp.isInternal,
                             ._requireUserInfo = stamp.requireUserInfo,
                             ._batchEvents = stamp.batchEvents,
                             ._startTimeStamp = stamp.start};
    identity.setSelfVersion(stamp.selfVersion);
    auto backend = std::static_pointer_cast<HTTPSPostBackend>(
        newBackendWithName(kVeskReportingBackendHTTPPost, Dictionary{{"clients", std::move(clients)}},
                           identity, harness.services));
    backend->setCombinedSessionIDString("session-text");
    backend->setSamplingFactor(stamp.draw);
    update(*backend, stamp.userInfo);
    return backend;
  }
  std::shared_ptr<HTTPSPostBackend> make(const Dictionary& only, const Stamp& stamp = {}) {
    return make(List{only}, stamp);
  }
  static void update(VeskReportingBackend& backend, const std::optional<Dictionary>& userInfo) {
    backend.setUserInfoDict(userInfo);
    backend.updateState();
  }
  static std::optional<std::string> send(VeskReportingBackend& backend,
                                         const std::optional<Dictionary>& payload = Dictionary(),
                                         int method = 3, std::int32_t flag = 0, std::uint16_t status = 2) {
    return backend.sendMessage(payload, at(kStart + 5.25), static_cast<std::uint16_t>(method), status, flag);
  }
  /// Sends the message that ends a session.
  static std::optional<std::string> sendStop(VeskReportingBackend& backend,
                                             const std::optional<Dictionary>& payload = Dictionary()) {
    return send(backend, payload, 0, 0, 1);
  }

  /// The posts since the last call.
  std::vector<ReceivedPost> takeAll() {
    auto posts = harness.posts();
    const std::size_t taken = std::exchange(_taken, posts.size());
    return {posts.begin() + static_cast<std::ptrdiff_t>(taken), posts.end()};
  }
  ReceivedPost take() { return takeAll().at(0); }
  /// The targets of the posts since the last call with their numbers of events: "/post 1".
  Lines takeTargets() {
    Lines all;
    for (const auto& post : takeAll())
      all.push_back(post.request.target + " " + std::to_string(post.events().size()));
    std::sort(all.begin(), all.end());
    return all;
  }
  /// The lines of HTTPS backends and the factory, each after its level, without the common prefix `begin`.
  static Lines linesOf(const CapturedLog& log, std::string_view begin = "") {
    Lines all;
    for (const auto& [level, line] : log.lines())
      for (auto source : {"HTTPSPostBackend(", "VeskReportingBackend(", "postJSONMessage: "})
        if (line.starts_with(source))
          all.push_back(std::to_string(level) + " " +
                        line.substr(line.starts_with(begin) ? begin.size() : 0));
    return all;
  }

  BackendHarness harness;

 private:
  std::size_t _taken = 0;
};

}  // namespace vesk::test
