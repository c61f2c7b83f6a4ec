#include "tools/collector/FaultPlan.h"

#include <charconv>

namespace vesk {

namespace {

using Kind = CollectorFault::Kind;
using Fault = HTTPAnswer::Fault;

constexpr std::size_t kMaximumPlanned = 1000;

struct NamedFault {
  std::string_view name;
  CollectorFault fault;
};
constexpr std::array kFaults{
    NamedFault{"stall", {Kind::Transport, 0, Fault::Stall}},
    NamedFault{"reset", {Kind::Transport, 0, Fault::ResetBeforeAnswer}},
    NamedFault{"close", {Kind::Transport, 0, Fault::CloseWithoutAnswer}},
    NamedFault{"garbage", {Kind::Transport, 0, Fault::Garbage}},
    NamedFault{"cut", {Kind::Transport, 0, Fault::ResetMidAnswer}},
    NamedFault{"slow", {Kind::Transport, 0, Fault::SlowBody}},
    NamedFault{"huge", {Kind::Transport, 0, Fault::HugeBody}},
    NamedFault{"empty-body", {Kind::EmptyBody, 0, Fault::None}},
    NamedFault{"bad-signature", {Kind::BadSignature, 0, Fault::None}},
};

std::optional<unsigned> numberIn(std::string_view text) {
  unsigned number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<CollectorFault> faultNamed(std::string_view name) {
  for (const auto& known : kFaults)
    if (known.name == name) return known.fault;
  if (name.starts_with("answer=")) name.remove_prefix(std::string_view("answer=").size());
  auto status = numberIn(name);
  if (!status || *status < 200 || *status > 599) return std::nullopt;
  return CollectorFault{Kind::Answer, *status, Fault::None};
}

std::optional<FaultTarget> targetNamed(std::string_view name) {
  for (std::size_t i = 0; i < kFaultTargetNames.size(); ++i)
    if (kFaultTargetNames[i] == name) return static_cast<FaultTarget>(i);
  return std::nullopt;
}

}  // namespace

bool CollectorFault::isOnlyInTheAnswer() const {
  switch (kind) {
    case Kind::Answer:
      return status < 300;
    case Kind::EmptyBody:
    case Kind::BadSignature:
      return true;
    case Kind::Transport:
      return transport == Fault::ResetMidAnswer || transport == Fault::SlowBody ||
             transport == Fault::HugeBody;
  }
  return false;
}

void CollectorFault::applyTo(HTTPAnswer& answer) const {
  if (kind == Kind::Answer) answer = HTTPAnswer::text(status, "answered on demand");
  if (kind == Kind::EmptyBody) answer.body.clear();
  if (kind == Kind::Transport) answer.fault = transport;
}

std::optional<std::string> FaultPlan::add(std::string_view text) {
  auto equals = text.find('=');
  auto target = targetNamed(text.substr(0, equals));
  if (!target || equals == std::string_view::npos)
    return "a fault is written as " + forms() + ", not '" + std::string(text) + "'";
  std::string_view name = text.substr(equals + 1);
  std::optional<unsigned> times;
  if (auto star = name.rfind('*'); star != std::string_view::npos) {
    times = numberIn(name.substr(star + 1));
    if (!times || *times == 0) return "how many times? " + std::string(text);
    name = name.substr(0, star);
  }

  auto fault = faultNamed(name);
  if (!fault && name != "none")
    return "unknown fault '" + std::string(name) + "': it must be " + faultNames();
  if (fault && fault->kind == Kind::BadSignature && *target != FaultTarget::Storebag)
    return "only a storebag can have a bad signature";

  MutexLock lock(_mutex);
  auto& planned = _planned[static_cast<std::size_t>(*target)];
  if (!fault) {
    planned.clear();
    return std::nullopt;
  }
  if (!planned.empty() && !planned.back().times) planned.pop_back();
  if (planned.size() >= kMaximumPlanned) return "too many faults are planned already";
  planned.push_back({*fault, std::string(name), times});
  return std::nullopt;
}

void FaultPlan::clear() {
  MutexLock lock(_mutex);
  for (auto& planned : _planned) planned.clear();
}

std::optional<CollectorFault> FaultPlan::take(FaultTarget target) {
  MutexLock lock(_mutex);
  auto& planned = _planned[static_cast<std::size_t>(target)];
  if (planned.empty()) return std::nullopt;
  CollectorFault fault = planned.front().fault;
  if (planned.front().times && --*planned.front().times == 0) planned.pop_front();
  return fault;
}

std::vector<std::string> FaultPlan::describe() const {
  std::vector<std::string> lines;
  MutexLock lock(_mutex);
  for (std::size_t target = 0; target < kFaultTargetNames.size(); ++target) {
    for (const auto& planned : _planned[target]) {
      std::string line = std::string(kFaultTargetNames[target]) + "=" + planned.name;
      if (planned.times) line += "*" + std::to_string(*planned.times);
      lines.push_back(std::move(line));
    }
  }
  return lines;
}

std::string FaultPlan::forms() {
  std::string forms;
  for (std::size_t i = 0; i < kFaultTargetNames.size(); ++i) {
    if (i > 0) forms += i + 1 < kFaultTargetNames.size() ? ", " : " or ";
    forms.append(kFaultTargetNames[i]).append("=FAULT");
  }
  return forms;
}

std::string FaultPlan::faultNames() {
  std::string names = "a status (200 to 599)";
  for (const auto& known : kFaults) names.append(", ").append(known.name);
  return names.append(" or none");
}

}  // namespace vesk
