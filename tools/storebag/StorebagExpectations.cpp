#include "backends/VeskReportingBackend.h"
#include "backends/https/PostExplanation.h"
#include "tools/storebag/StorebagCases.h"
#include "tools/storebag/StorebagReview.h"

namespace vesk {

namespace {

bool isInteger(const Value& value) { return value.isNumber() && value.boolean() == nullptr; }

/// A table {sha256 = "text"} means the digest of that text.
Value wantedOf(const Value& expected) {
  const auto digested =
      expected.dictionary() != nullptr ? expected.dictionary()->text("sha256") : std::nullopt;
  return digested ? Value(VeskReportingBackend::convertIntoSHA256(digested->view())) : expected;
}

bool isSame(const Value& value, const Value& wanted) {
  return isInteger(value) && isInteger(wanted) ? value.asDouble() == wanted.asDouble() : value == wanted;
}

/// One case that is being checked.
class Trial {
 public:
  Trial(const StorebagCase& tested, const Dictionary& payload) : _case(tested), _payload(payload) {}

  std::vector<std::string> run() && {
    const auto section = sectionFor(_payload, _case.device, _case.session.clientType);
    if (!section) return {section.error().text};
    decide(section->find(_case.backend));
    checkState();
    checkURL();
    if (_case.expect.contains("fields") || _case.expect.contains("removed")) checkEvent();
    return std::move(_failures);
  }

 private:
  void decide(const Value* profile) {
    const Dictionary backends =
        evaluateStorebag(_payload, _case.device, _case.session).dictionary("backends").value_or(Dictionary());
    const auto explanation = backends.dictionary(_case.backend);
    if (!explanation || !isBuilt(_case.backend, *profile)) return;
    _explanation = *explanation;
    _state = _explanation.text("state")->string();
    if (isPostBackend(_case.backend))
      _event = eventThatLeaves(*profile->dictionary(), _case.device, _case.session, _case.message);
  }

  std::string because() const {
    const auto reason = _explanation.text("reason");
    return reason ? ", since " + reason->string() : "";
  }

  void checkState() {
    const auto wanted = _case.expect.text("state");
    if (wanted && wanted->view() != _state)
      _failures.push_back("the state is " + _state + ", not " + wanted->string() + because());
  }

  void checkURL() {
    const auto wanted = _case.expect.text("url");
    if (!wanted) return;
    const auto url = _explanation.text("postURL");
    if (!url) {
      _failures.push_back("there is no URL, not " + wanted->string());
    } else if (*url != wanted->view()) {
      _failures.push_back("the URL is " + url->string() + ", not " + wanted->string());
    }
  }

  void checkEvent() {
    if (!_event) {
      _failures.push_back("no event leaves, the state is " + _state + because());
      return;
    }
    for (const auto& [key, expected] : _case.expect.dictionary("fields").value_or(Dictionary())) {
      const Value wanted = wantedOf(expected);
      const Value* value = _event->find(key.view());
      if (value == nullptr) {
        _failures.push_back("'" + key.string() + "' does not leave");
      } else if (!isSame(*value, wanted)) {
        _failures.push_back("'" + key.string() + "' leaves as " + describe(*value, 80) + ", not " +
                            describe(wanted, 80));
      }
    }
    for (const Value& key : _case.expect.list("removed").value_or(List())) checkRemoved(key.text()->string());
  }

  void checkRemoved(const std::string& key) {
    if (const Value* value = _event->find(key)) {
      _failures.push_back("'" + key + "' leaves as " + describe(*value, 80));
    } else if (!isInMessage(key)) {
      _failures.push_back("'" + key + "' is in neither the payload nor the user info, so nothing removes it");
    }
  }

  bool isInMessage(const std::string& key) const {
    const bool isOfRecord = key.starts_with('_') || key == "eventTime";
    return isOfRecord || (_case.message.payload && _case.message.payload->contains(key)) ||
           (_case.session.userInfo && _case.session.userInfo->contains(key));
  }

  const StorebagCase& _case;
  const Dictionary& _payload;
  std::string _state = "absent";
  Dictionary _explanation;
  std::optional<Dictionary> _event;
  std::vector<std::string> _failures;
};

}  // namespace

std::vector<std::string> failuresOf(const StorebagCase& tested, const Dictionary& payload) {
  return Trial(tested, payload).run();
}

}  // namespace vesk
