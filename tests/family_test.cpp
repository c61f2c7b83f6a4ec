// Families of sessions: parents, combined IDs, reporting states, aggregation.
#include <atomic>
#include <future>
#include <latch>
#include <limits>
#include <sstream>

#include "tests/support/CapturedLog.h"
#include "tests/support/FamilyHarness.h"

namespace vesk::test {
namespace {

using Family = FamilyHarness;

std::string without(std::string places, const std::string& others) {
  std::erase_if(places, [&](char place) { return others.find(place) != std::string::npos; });
  return places;
}

TEST_F(Family, EveryWalkTakesTheFirstOfEachLevel) {
  // levels: in the order of joining; a session is named by its position
  // aggregating: the sessions that aggregate once all have joined
  // identity: from the top
  // ancestor: the one that aggregates
  // remaining: the sessions that still aggregate after `asker` has refreshed those below it
  const std::tuple<const char*, std::string, std::string, char, std::string, std::string, std::string,
                   std::string>
      rows[] = {{"the top", "0123", "0123", '0', "", "", "", "0"},
                {"a top that does not aggregate", "012", "12", '0', "", "", "", "12"},
                {"a child", "0123", "", '1', "0", "0", "", ""},
                {"a child that aggregates", "012", "12", '1', "0", "0", "", "1"},
                {"a child below one that aggregates", "012", "02", '1', "0", "0", "0", "0"},
                {"three levels down", "0123", "023", '3', "2", "012", "0", "02"},
                {"joined the other way round", "3210", "012", '0', "1", "321", "2", "12"},
                {"the highest that aggregates", "0123", "12", '3', "2", "012", "1", "12"},
                {"two at the top", "001", "01", '2', "0", "0", "0", "01"},
                {"two at the top, of which the second aggregates", "001", "12", '2', "0", "0", "", "12"},
                {"two in the middle", "0112", "12", '3', "1", "01", "1", "12"},
                {"two in the middle, of which the second aggregates", "0112", "2", '3', "1", "01", "", "2"},
                {"the first of two in the middle", "0112", "123", '1', "0", "0", "", "12"},
                {"a gap right above", "02", "0", '1', "", "", "0", "0"},
                {"a gap further up", "023", "1", '2', "1", "1", "1", "1"},
                {"nothing at the top", "12", "", '1', "0", "0", "", ""},
                {"alone", "2", "0", '0', "", "", "", "0"}};
  for (const auto& [what, levels, aggregating, asker, parent, identity, ancestor, remaining] : rows) {
    SCOPED_TRACE(what);
    std::map<char, DrivenSession> members;
    std::map<std::shared_ptr<ReportingdSession>, std::string> places{{nullptr, ""}};
    for (char level : levels) {
      const char place = static_cast<char>('0' + members.size());
      auto member = members.emplace(place, join(level - '0')).first;
      places.emplace(member->second.session, std::string(1, place));
    }
    for (auto& [place, member] : members) {
      if (aggregating.find(place) == std::string::npos) continue;
      member->setSessionInfo(member->sessionInfo().value(), userInfo("MyApp"), {}, true);
    }
    DrivenSession& asking = members.at(asker);
    std::string chain;
    for (char place : identity) chain += (chain.empty() ? "" : ".") + members.at(place)->sessionIDString();
    EXPECT_EQ(harness.agent->parentSessionIDStringForSession(*asking.session).value_or(""), chain);
    {
      RecursiveMutexLock lock(harness.agent->monitor());
      EXPECT_EQ(places.at(harness.agent->parentSessionForChild(*asking.session)), parent);
      EXPECT_EQ(places.at(harness.agent->getAncestorWithAggregatorForSession(*asking.session)), ancestor);
    }
    // A message goes to the ancestor or to the sender's own client, never to both.
    std::string told, closed, left;
    auto listen = [&](std::string& list, const std::string& expected) {
      for (auto& [place, member] : members) {
        member.connection->calls.clear();
        member.connection->onCall = [&, expected, place = place,
                                     connection = member.connection.get()](const auto&) {
          list += place;
          EXPECT_EQ(connection->told().back(), expected);
        };
      }
    };
    listen(told, std::to_string(asking->sessionID()) + R"(: 1700000000.000000 3/2 {"a": "text"})");
    asking.send(message());
    const bool isOwn = aggregating.find(asker) != std::string::npos;
    EXPECT_EQ(told, !ancestor.empty() ? ancestor : std::string(isOwn, asker));

    listen(closed, "closing: 0.000000 0/0");
    harness.agent->updateDownstreamSessions(*asking.session);
    for (auto& [place, member] : members) {
      if (member->hasAggregator()) left += place;
      member.connection->onCall = nullptr;
    }
    EXPECT_EQ(left, remaining);
    EXPECT_EQ(closed, without(aggregating, remaining));
  }
}

TEST_F(Family, ArrivalsRefreshThoseBelowInTheOrderOfJoining) {
  // A session's states depend on its parent's states when it joins.
  const std::pair<std::vector<int>, bool> rows[] = {
      {{0, 1, 2}, true}, {{0, 2, 1}, true}, {{1, 2, 0}, true}, {{2, 1, 0}, false}};
  for (const auto& [levels, isEnabled] : rows) {
    std::map<int, DrivenSession> members;
    for (int level : levels) members.emplace(level, join(level, false, level == 2 ? "MYAPP" : "MyApp"));
    const auto& last = members.at(2);
    EXPECT_EQ(last->fetchReportingStates(), isEnabled ? BackendNames{"httpPost"} : BackendNames{});
    if (!isEnabled) continue;
    EXPECT_EQ(last->samplingThresholdWithBackendName("httpPost"), Value(1.0)) << "the parent's";
    harness.posts();
    members.at(2).send(message());
    EXPECT_EQ(lastSessionID(), members.at(0)->sessionIDString() + "." + members.at(1)->sessionIDString() +
                                   "." + last->sessionIDString());
  }
}

TEST_F(Family, AChildCopiesItsParentsStatesButAnOverride) {
  // A backend with its sampling threshold; a dashboard has none. Without `override_sampling`, a backend that
  // is sampled out is in state 3.
  auto storebag = [&](int level, const std::string& backends) {
    MutableDictionary section;
    std::istringstream words(backends);
    for (std::string name, threshold; words >> name >> threshold;) {
      MutableDictionary entry(
          *profile(level, std::atof(threshold.c_str())).list("clients")->begin()->dictionary());
      if (threshold == "override") entry.remove("override_sampling");
      section.set(Text(name), Dictionary{{"ip", "127.0.0.1"}, {"port", 9}, {"clients", List{entry.share()}}});
    }
    return section.share();
  };
  const std::tuple<const char*, const char*, BackendNames> rows[] = {
      {"httpPost 1", "httpPost 0", {"httpPost"}},
      {"httpPost 1", "httpPost 0 dashboard -", {"httpPost"}},
      {"dashboard - httpPost2 1.5 httpPost 1",
       "httpPost 0 httpPost2 0 dashboard -",
       {"httpPost", "httpPost2", "dashboard"}},
      {"httpPost 0", "httpPost 1", {}},
      {"httpPost 1", "httpPost override", {}}};
  for (const auto& [ofParent, ofChild, enabled] : rows) {
    harness.storebags[5] = storebag(0, ofParent);
    harness.storebags[6] = storebag(1, ofChild);
    harness.clock.advance(std::chrono::hours(2));
    auto parent = join(0), child = join(1);
    EXPECT_EQ(names, enabled) << ofChild;
    for (const std::string& name : enabled)
      EXPECT_EQ(child->samplingThresholdWithBackendName(name),
                parent->samplingThresholdWithBackendName(name));
    child.send(message(2));  // lifts an override
    const bool isLifted = std::string_view(ofChild).ends_with("override");
    EXPECT_EQ(child->fetchReportingStates(), isLifted ? BackendNames{"httpPost"} : enabled);
  }
}

TEST_F(Family, GroupedAnewASessionIsTheLast) {
  auto first = join(0);
  auto second = join(0);
  auto child = join(1);
  auto parent = [&] { return harness.agent->parentSessionIDStringForSession(*child.session); };
  EXPECT_EQ(parent(), first->sessionIDString());
  first.states(userInfo("MYAPP"));  // the same family
  EXPECT_EQ(parent(), second->sessionIDString());
  second.states(userInfo("Other"));
  EXPECT_EQ(parent(), first->sessionIDString());
  first.states(std::nullopt);
  EXPECT_EQ(parent(), std::nullopt);
  second.states(userInfo("myapp"));
  EXPECT_EQ(parent(), second->sessionIDString());
}

TEST_F(Family, LongNamesFillNoLog) {
  const std::string name(1 << 20, 'x');
  auto sibling = join(1, false, name.c_str());
  CapturedLog log;
  auto child = join(1, false, (name + "y").c_str());
  child->setSessionInfo(sessionInfo(1), userInfo(name.c_str()), {}, false);
  harness.agent->updateDownstreamSessions(*child.session);
  const std::string shown = " not found for user info key " + std::string(256, 'x');
  EXPECT_EQ(log.countContaining(3, shown), 2);
  EXPECT_EQ(log.countContaining(3, shown + "x"), 0);
  for (const auto& [level, line] : log.lines()) EXPECT_LT(line.size(), 1024u);
}

TEST_F(Family, LevelsMayBeAnyNumber) {
  auto top = join(0, true);
  harness.storebags[8] = Dictionary{{"httpPost", profile(std::numeric_limits<std::int32_t>::max(), 1.0)}};
  harness.storebags[9] = Dictionary{{"httpPost", profile(std::numeric_limits<std::int32_t>::min(), 1.0)}};
  join(3).send(message());
  ASSERT_FALSE(top.connection->calls.empty());
  const std::size_t before = top.connection->calls.size();
  CapturedLog log;
  join(4).send(message());
  EXPECT_EQ(top.connection->calls.size(), before);
  EXPECT_EQ(log.countContaining(6, "Found a gap"), 0) << "nothing is above it";
}

TEST_F(Family, ASessionLeavesItsFamilyUnderWhateverNameItJoined) {
  std::weak_ptr<ReportingdSession> configuredAnew;
  {
    auto session = join(0);
    session->setSessionInfo(Dictionary(), userInfo("Other"), {}, false);
    configuredAnew = session.session;
  }
  EXPECT_TRUE(configuredAnew.expired());
}

TEST_F(Family, NobodyTakesASessionThatStartsForItsParent) {
  harness.storebags[6] =
      Dictionary{{"httpPost", Dictionary{{"clients", List{Dictionary{{"hierarchy", 1},
                                                                     {"expedite", 1},
                                                                     {"locale_whitelist", List{"US"}},
                                                                     {"filters", List{Dictionary()}},
                                                                     {"sampling_threshold", 1.0}}}}}}};
  auto sibling = join(1);
  auto starting = harness.newSession();
  starting->setSessionInfo(sessionInfo(1), userInfo("MyApp"), {}, false);
  std::future<void> refresh;
  std::atomic_flag isAsked;  // the sibling's thread logs as well
  SystemLog::setLevel(7);
  SystemLog::setSink([&](LogLevel, std::string_view line) {
    // The session is in its family now, but its level is not decided yet.
    if (line.find("Store bag override") == std::string_view::npos || isAsked.test_and_set()) return;
    refresh =
        std::async(std::launch::async, [&] { sibling->fetchStatesWithUserInfo(userInfo("MYAPP"), {}); });
    refresh.wait_for(std::chrono::milliseconds(100));  // it finishes, or waits for this thread
  });
  starting.start();
  refresh.get();
  SystemLog::setSink(nullptr);
  SystemLog::setLevel(6);
  EXPECT_EQ(sibling->fetchReportingStates(), BackendNames{"httpPost"});
}

TEST_F(Family, AtTheTopNothingWaitsForAStorebag) {
  CapturedLog log;
  auto top = join(0);
  auto child = join(1);
  auto unrelated = harness.newSession();  // without user info
  unrelated->setSessionInfo(sessionInfo(0), std::nullopt, {}, true);
  unrelated.start();
  std::latch held(1), accepted(1);
  auto fetch = std::async(std::launch::async, [&] {
    RecursiveMutexLock lock(harness.agent->monitor());
    held.count_down();
    accepted.wait();
  });
  held.wait();
  auto connection = std::make_shared<RecordingConnection>();
  EXPECT_TRUE(harness.agent->shouldAcceptNewConnection(connection));
  EXPECT_EQ(log.countContaining(7, "Accepting new Orvo connection recording connection, 0(1) connections."),
            1);
  EXPECT_TRUE(top.send(message()));
  unrelated.connection->calls.clear();
  unrelated.send(message());
  EXPECT_EQ(unrelated.connection->calls.size(), 1u);
  EXPECT_EQ(log.count(6, "getAncestorWithAggregatorForSession: No user info found for session 100"), 2)
      << "with its start";
  accepted.count_down();
  fetch.get();
  EXPECT_TRUE(child.send(message()));
  connection->invalidate();
}

TEST_F(Family, ClientsThatLeaveLoseNothing) {
  { auto neverStarted = harness.newSession(); }
  {
    auto aggregator = join(0, true);
    aggregator.connection->clientIsGone = true;
  }
  EXPECT_EQ(harness.dropped(DropReason::NoBackend) + harness.dropped(DropReason::NotAggregated), 0u);
}

/// Whether another thread can take the agent's monitor now.
bool monitorIsFree(AgentHarness& harness) {
  auto taken = std::make_shared<std::promise<void>>();
  std::thread([taken, agent = harness.agent] {
    RecursiveMutexLock lock(agent->monitor());
    taken->set_value();
  }).detach();
  return taken->get_future().wait_for(std::chrono::seconds(10)) == std::future_status::ready;
}

TEST_F(Family, AnAncestorThatEndsWhileAChildSendsIsDestroyedByTheChildOutsideTheMonitor) {
  CapturedLog log;
  auto top = join(0, true);
  auto child = join(1);
  auto connection = top.connection;
  std::weak_ptr<ReportingdSession> watched = top.session;
  std::optional<bool> freeAtTheEnd;
  connection->onCall = [&](const IPCOutgoingCall& call) {
    if (!std::get<std::optional<Dictionary>>(call.arguments.at(0))) {
      freeAtTheEnd = monitorIsFree(harness);  // the closing message, sent by the session's destructor
    } else if (top.session) {
      harness.agent->sessionInvalidated(top.session);  // its connection ends during the delivery
      top.session.reset();
    }
  };
  child.send(message());
  EXPECT_TRUE(watched.expired());
  EXPECT_EQ(freeAtTheEnd, true);
  EXPECT_EQ(harness.agent->parentSessionIDStringForSession(*child.session), std::nullopt)
      << "left its family";
  connection->onCall = nullptr;
}

TEST_F(Family, ManyInventedNamesDoNotFillTheMemory) {
  auto session = join(0);
  auto families = [&] {
    CapturedLog log;
    auto connection = std::make_shared<RecordingConnection>();
    harness.agent->shouldAcceptNewConnection(connection);
    connection->invalidate();
    const std::string line = log.lines().at(0).second;
    return std::stoi(line.substr(line.find('(') + 1));
  };
  auto rename = [&](const std::string& name) {
    session->fetchStatesWithUserInfo(userInfo(name.c_str()), {});
  };
  for (int i = 0; i < 600; ++i) rename(std::to_string(i));
  const int before = families();
  EXPECT_GT(before, 1);
  EXPECT_LE(before, 256);
  for (int i = 0; i < 9; ++i) rename(std::string(2000, 'x') + std::to_string(i));
  EXPECT_LE(families(), before + 2) << "the present one and the one before";
}

TEST_F(Family, AClientThatTakesNoMessagesCostsOneLineAndNobodyElse) {
  CapturedLog log;
  auto parent = join(0, true);
  auto child = join(1, false, "MyApp", true);
  parent.connection->clientIsGone = true;
  for (int i = 0; i < 100; ++i) child.send(message(0));
  child->flushMessagesWithReply({});
  std::size_t posted = 0;
  for (const auto& post : harness.posts())
    for (const auto& event : post.events()) posted += event.at("_method") == 3;
  EXPECT_EQ(posted, 100u) << "the sender does not notice";
  EXPECT_EQ(harness.dropped(DropReason::NotAggregated), 100u);
  EXPECT_EQ(log.count(3, "sendMessageWithDictionary: Failed to get remote object proxy: gone"), 1);
}

}  // namespace
}  // namespace vesk::test
