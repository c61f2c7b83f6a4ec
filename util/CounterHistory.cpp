#include "util/CounterHistory.h"

#include <algorithm>
#include <map>

#include "platform/files/PrivateFile.h"
#include "platform/log/SystemLog.h"
#include "platform/preferences/TomlFile.h"

namespace vesk {

namespace {

std::vector<Counters::Count> read(const std::string& path) {
  std::vector<Counters::Count> counts;
  for (const auto& [backend, reasons] : readTomlFile(path, TrustedOwner::OwnUser)) {
    if (!reasons.dictionary()) continue;
    for (std::size_t i = 0; i < kDropReasonCount; ++i) {
      const auto reason = static_cast<DropReason>(i);
      const auto count = integerForKey(*reasons.dictionary(), nameOfDropReason(reason));
      if (count && *count > 0)
        counts.push_back({backend.string(), reason, static_cast<std::uint64_t>(*count)});
    }
  }
  return counts;
}

std::string asToml(const std::vector<Counters::Count>& counts) {
  std::string text = "# What was lost or delayed since the installation.\n", table;
  for (const auto& [backend, reason, count] : counts) {
    if (backend != table) text += "[\"" + (table = backend) + "\"]\n";
    text += std::string(nameOfDropReason(reason)) + " = " + std::to_string(count) + "\n";
  }
  return text;
}

}  // namespace

CounterHistory::CounterHistory(std::string path, const Counters& counters)
    : _path(std::move(path)), _counters(counters), _earlier(read(_path)) {}

std::vector<Counters::Count> CounterHistory::total() const {
  std::map<std::pair<std::string, DropReason>, std::uint64_t> sums;
  for (const auto& counts : {_earlier, _counters.snapshot()}) {
    for (const auto& [backend, reason, count] : counts) sums[{backend, reason}] += count;
  }
  std::vector<Counters::Count> total;
  total.reserve(sums.size());
  for (const auto& [of, count] : sums) total.push_back({of.first, of.second, count});
  return total;
}

void CounterHistory::save() {
  if (_counters.snapshot().empty()) return;
  std::string text = asToml(total());
  MutexLock lock(_mutex);
  if (text == _saved) return;
  if (const auto written = replacePrivateFile(_path, text); !written) {
    if (!std::exchange(_hasFailed, true))
      VESK_LOG_WARNING("main: cannot write %s: %s", _path.c_str(), written.error().text.c_str());
    return;
  }
  _saved = std::move(text);
}

}  // namespace vesk
