#include "tools/collector/FaultPlan.h"

#include <charconv>

namespace vesk {

namespace {

using Fault = HTTPAnswer::Fault;

constexpr std::size_t kMaximumPlanned = 1000;

struct NamedFault {
  std::string_view name;
  CollectorFault fault;
};
constexpr std::array kFaults{
    NamedFault{"stall", {.transport = Fault::Stall}},
    NamedFault{"reset", {.transport = Fault::ResetBeforeAnswer}},
    NamedFault{"close", {.transport = Fault::CloseWithoutAnswer}},
    NamedFault{"garbage", {.transport = Fault::Garbage}},
    NamedFault{"cut", {.transport = Fault::ResetMidAnswer, .isOnlyInTheAnswer = true}},
    NamedFault{"slow", {.transport = Fault::SlowBody, .isOnlyInTheAnswer = true}},
    NamedFault{"huge", {.transport = Fault::HugeBody, .isOnlyInTheAnswer = true}},
    NamedFault{"empty-body", {.emptyBody = true, .isOnlyInTheAnswer = true}},
    NamedFault{"bad-signature", {.badSignature = true, .isOnlyInTheAnswer = true}},
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
  return CollectorFault{.status = *status, .isOnlyInTheAnswer = *status < 300};
}

}  // namespace

void CollectorFault::applyTo(HTTPAnswer& answer) const {
  if (status != 0) answer = HTTPAnswer::text(status, "answered on demand");
  if (emptyBody) answer.body.clear();
  if (transport != Fault::None) answer.fault = transport;
}

std::optional<std::string> FaultPlan::add(std::string_view text) {
  MutexLock lock(_mutex);
  auto equals = text.find('=');
  Target* target = find(text.substr(0, equals));
  if (target == nullptr || equals == std::string_view::npos)
    return "a fault is written as " + std::string(kForms) + ", not '" + std::string(text) + "'";
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
  if (fault && fault->badSignature && target->first != "storebag")
    return "only a storebag can have a bad signature";

  auto& planned = target->second;
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
  for (auto& [name, planned] : _targets) planned.clear();
}

FaultPlan::Target* FaultPlan::find(std::string_view name) {
  for (auto& target : _targets)
    if (target.first == name) return &target;
  return nullptr;
}

std::optional<CollectorFault> FaultPlan::take(std::string_view target) {
  MutexLock lock(_mutex);
  auto* found = find(target);
  if (found == nullptr || found->second.empty()) return std::nullopt;
  auto& planned = found->second;
  CollectorFault fault = planned.front().fault;
  if (planned.front().times && --*planned.front().times == 0) planned.pop_front();
  return fault;
}

std::vector<std::string> FaultPlan::describe() const {
  std::vector<std::string> lines;
  MutexLock lock(_mutex);
  for (const auto& [target, faults] : _targets)
    for (const auto& planned : faults)
      lines.push_back(std::string(target) + "=" + planned.name +
                      (planned.times ? "*" + std::to_string(*planned.times) : ""));
  return lines;
}

std::string FaultPlan::faultNames() {
  std::string names = "a status (200 to 599)";
  for (const auto& known : kFaults) names.append(", ").append(known.name);
  return names.append(" or none");
}

}  // namespace vesk
