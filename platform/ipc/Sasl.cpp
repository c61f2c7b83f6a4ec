#include "platform/ipc/Sasl.h"

#include <sys/random.h>

#include <algorithm>
#include <array>
#include <iterator>

#include "platform/text/ASCII.h"

namespace vesk {

namespace {

constexpr std::string_view kLineEnd = "\r\n";

/// The ID of this process's listener; clients ignore it.
const std::string& serverIdentity() {
  static const std::string identity = [] {
    std::array<unsigned char, 16> bytes{};
    [[maybe_unused]] auto filled = ::getrandom(bytes.data(), bytes.size(), 0);
    return hexLower({bytes.data(), bytes.size()});
  }();
  return identity;
}

/// A claim is the decimal user number, with its characters written as hexadecimal digits. An empty claim
/// means the client's actual identity and is always true.
bool isTrue(std::string_view claim, uid_t user) {
  const std::string number = std::to_string(user);
  const std::string truth = hexLower({reinterpret_cast<const unsigned char*>(number.data()), number.size()});
  auto alike = [](char a, char b) { return a == b || (a >= 'A' && a <= 'F' && a + ('a' - 'A') == b); };
  return claim.empty() || std::equal(claim.begin(), claim.end(), truth.begin(), truth.end(), alike);
}

/// Removes `word` and the following blank from the front of `line`.
bool takeWord(std::string_view& line, std::string_view word) {
  if (line != word && !(line.starts_with(word) && line[word.size()] == ' ')) return false;
  line.remove_prefix(std::min(line.size(), word.size() + 1));
  return true;
}

}  // namespace

SaslServer::Step SaslServer::step(std::string_view data) {
  Step step;
  if (!_seenFirstByte && !data.empty()) {
    if (data[0] != '\0') return {Verdict::Refused};
    _seenFirstByte = true;
    step.taken = 1;
  }
  for (;;) {
    const auto rest = data.substr(step.taken);
    const auto end = rest.find(kLineEnd);
    if (std::min(end, rest.size()) > kMaximumLine) return {Verdict::Refused};
    if (end == std::string_view::npos) return step;
    if (++_lines > kMaximumLines) return {Verdict::Refused};
    step.taken += end + kLineEnd.size();
    step.answer += answerTo(rest.substr(0, end));
    if (_state == State::Refused) return {Verdict::Refused};
    if (_state == State::Begun) {
      step.verdict = Verdict::Begun;
      return step;
    }
  }
}

std::string SaslServer::reject() {
  _state = State::WantsAuth;
  return "REJECTED EXTERNAL\r\n";
}

std::string SaslServer::check(std::string_view claim) {
  if (!isTrue(claim, _peer)) return reject();
  _state = State::WantsBegin;
  return "OK " + serverIdentity() + "\r\n";
}

std::string SaslServer::answerTo(std::string_view line) {
  if (takeWord(line, "AUTH")) {
    if (!takeWord(line, "EXTERNAL")) return reject();
    if (!line.empty()) return check(line);
    _state = State::WantsData;
    return "DATA\r\n";
  }
  if (_state == State::WantsData && takeWord(line, "DATA")) return check(line);
  if (takeWord(line, "CANCEL") || takeWord(line, "ERROR")) return reject();
  if (_state == State::WantsBegin && line == "NEGOTIATE_UNIX_FD") return "AGREE_UNIX_FD\r\n";
  if (line != "BEGIN") return "ERROR\r\n";
  _state = _state == State::WantsBegin ? State::Begun : State::Refused;
  return {};
}

std::string_view SaslClient::greeting() noexcept {
  using namespace std::string_view_literals;
  return "\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv;
}

SaslClient::Step SaslClient::step(std::string_view data) {
  constexpr std::string_view kExpected[] = {"DATA", "OK", "AGREE_UNIX_FD"};
  Step step;
  while (_answers < std::size(kExpected)) {
    const auto rest = data.substr(step.taken);
    const auto end = rest.find(kLineEnd);
    auto line = rest.substr(0, end);
    if (line.size() > SaslServer::kMaximumLine) return {Verdict::Refused, 0};
    if (end == std::string_view::npos) return step;
    step.taken += end + kLineEnd.size();
    auto word = line;
    if (!takeWord(word, kExpected[_answers])) {
      _refusal = line;
      return {Verdict::Refused, step.taken};
    }
    ++_answers;
  }
  step.verdict = Verdict::Accepted;
  return step;
}

}  // namespace vesk
