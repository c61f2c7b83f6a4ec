// The outcome of a call, as its caller receives it.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>
#include <VeskReporting/veskreporting.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/ipc/BusClient.h"

struct vesk_result {
  vesk::ReportingStatus status = vesk::ReportingStatus::Done;
  std::string detail{};
  std::optional<std::string> text{};
  bool accepted = false;
  std::vector<std::string> backends{};
};

namespace vesk {

using ReportingAnswer = ::vesk_result;

/// What the daemon's answer to a call contains.
enum class AnswerKind : std::uint8_t { Nothing, Backends, Text, OptionalText, Accepted };

/// Reads the first argument of `answer` into `result`. Returns false if it is of another type.
inline bool readAnswer(AnswerKind kind, BusAnswer& answer, ReportingAnswer& result) {
  switch (kind) {
    case AnswerKind::Nothing:
      return true;
    case AnswerKind::Backends: {
      std::optional<std::vector<std::string>> names;
      if (!answer.read(names)) return false;
      result.accepted = names.has_value();
      if (names) result.backends = std::move(*names);
      return true;
    }
    case AnswerKind::Text:
      return answer.read(result.text.emplace());
    case AnswerKind::OptionalText:
      return answer.read(result.text);
    case AnswerKind::Accepted:
      return answer.read(result.accepted);
  }
  return false;
}

}  // namespace vesk
