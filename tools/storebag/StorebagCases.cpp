#include "tools/storebag/StorebagCases.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <limits>

#include "protocol/StorebagName.h"
#include "tools/storebag/StorebagKeys.h"
#include "tools/storebag/StorebagSource.h"

namespace vesk {

namespace {

using std::string_view;

constexpr StorebagKey kExpectKeys[] = {{"state", KeyType::Text, {}},
                                       {"url", KeyType::Text, {}},
                                       {"fields", KeyType::Table, {}},
                                       {"removed", KeyType::Texts, {}}};

constexpr StorebagKey kCaseKeys[] = {{"name", KeyType::Text, {}},        {"client", KeyType::Text, {}},
                                     {"device", KeyType::Table, {}},     {"payload", KeyType::Table, {}},
                                     {"category", KeyType::Integer, {}}, {"type", KeyType::Integer, {}},
                                     {"backend", KeyType::Text, {}},     {"expect", KeyType::Table, {}}};

constexpr StorebagKey kTopKeys[] = {
    {"storebag", KeyType::Text, {}}, {"device", KeyType::Table, {}}, {"case", KeyType::Tables, {}}};

constexpr StorebagKey kClientKeys[] = {{"type", KeyType::Integer, {}},
                                       {"requireUserInfo", KeyType::Boolean, {}},
                                       {"batch", KeyType::Boolean, {}},
                                       {"draw", KeyType::Number, {}}};

/// A client may be a name or a table, a device a table or a path.
bool hasOtherForm(string_view key, const Value& value) {
  return (key == "client" && value.dictionary() != nullptr) || (key == "device" && value.text() != nullptr);
}

Result<void> checkKeys(const Dictionary& table, std::span<const StorebagKey> keys) {
  for (const auto& [key, value] : table) {
    const StorebagKey* known = keyNamed(keys, key.view());
    if (known == nullptr) return malformed(key.string() + ": unknown key" + nearestKey(key.view(), keys));
    if (!hasType(value, known->type) && !hasOtherForm(key.view(), value))
      return malformed(key.string() + ": must be " + std::string(nameOf(known->type)) + ", is " +
                       describe(value, 60));
  }
  return {};
}

Result<Dictionary> factsFrom(const Value& device, const std::filesystem::path& directory) {
  if (const Dictionary* facts = device.dictionary()) return *facts;
  return readTomlOrJSON(directory / device.text()->string());
}

Result<StorebagSession> sessionFrom(const Value* client, std::int32_t clientType) {
  StorebagSession session{.clientType = clientType, .userInfo = Dictionary()};
  if (client == nullptr) return session;
  if (const Text* name = client->text()) {
    session.userInfo = Dictionary{{kVeskReportingUserInfoClientName, *name}};
    return session;
  }
  MutableDictionary userInfo(*client->dictionary());
  for (const auto& key : kClientKeys) {
    const Value* value = userInfo.find(key.key);
    if (value != nullptr && !hasType(*value, key.type))
      return malformed("client." + std::string(key.key) + ": must be " + std::string(nameOf(key.type)));
  }
  const Dictionary& said = *client->dictionary();
  session.clientType = static_cast<std::int32_t>(integerForKey(said, "type").value_or(clientType));
  session.requireUserInfo = booleanForKey(said, "requireUserInfo").value_or(true);
  session.batchEvents = booleanForKey(said, "batch").value_or(false);
  session.draw = doubleForKey(said, "draw").value_or(0);
  for (const auto& key : kClientKeys) userInfo.remove(key.key);
  session.userInfo = userInfo.share();
  return session;
}

Result<std::uint16_t> numberOf16Bits(const Dictionary& table, string_view key, std::uint16_t otherwise) {
  const auto number = integerForKey(table, key);
  if (!number) return otherwise;
  if (*number < 0 || *number > std::numeric_limits<std::uint16_t>::max())
    return malformed(std::string(key) + ": must be from 0 to 65535");
  return static_cast<std::uint16_t>(*number);
}

/// The case without session and device.
Result<StorebagCase> partsOf(const Dictionary& source, std::size_t index) {
  StorebagCase read;
  read.name = "case " + std::to_string(index + 1);
  if (const auto name = source.text("name")) read.name = name->string();
  if (const auto backend = source.text("backend")) read.backend = backend->string();
  read.message.payload = source.dictionary("payload");
  const auto category = numberOf16Bits(source, "category", read.message.category);
  if (!category) return category.error();
  const auto type = numberOf16Bits(source, "type", read.message.type);
  if (!type) return type.error();
  read.message.category = *category;
  read.message.type = *type;
  read.expect = source.dictionary("expect").value_or(Dictionary());
  if (read.expect.empty()) return malformed("expect: missing, the case can't fail");
  if (const auto checked = checkKeys(read.expect, kExpectKeys); !checked)
    return malformed("expect." + checked.error().text);
  return read;
}

Result<StorebagCase> readCase(const StorebagCases& all, std::size_t index, std::int32_t clientType,
                              const std::filesystem::path& directory) {
  const Dictionary& source = *all.cases[index].dictionary();
  if (const auto checked = checkKeys(source, kCaseKeys); !checked) return checked.error();
  auto read = partsOf(source, index);
  if (!read) return read;
  auto session = sessionFrom(source.find("client"), clientType);
  if (!session) return session.error();
  read->session = *std::move(session);
  MutableDictionary facts(all.device);
  if (const Value* device = source.find("device")) {
    auto own = factsFrom(*device, directory);
    if (!own) return own.error();
    facts.setAll(*own);
  }
  auto device = storebagDevice(facts.share());
  if (!device) return malformed("device." + device.error().text);
  read->device = *std::move(device);
  return read;
}

}  // namespace

Result<StorebagCases> storebagCasesIn(const std::filesystem::path& file) {
  const Dictionary document = readTomlOrJSON(file);
  if (const auto checked = checkKeys(document, kTopKeys); !checked) return checked.error();
  StorebagCases all;
  if (const auto path = document.text("storebag")) all.storebag = file.parent_path() / path->string();
  if (const Value* device = document.find("device")) {
    auto facts = factsFrom(*device, file.parent_path());
    if (!facts) return facts.error();
    all.device = *std::move(facts);
  }
  all.cases = document.list("case").value_or(List());
  if (all.cases.empty()) return malformed("there is no [[case]]");
  return all;
}

Result<StorebagCase> storebagCaseAt(const StorebagCases& all, std::size_t index, std::int32_t clientType,
                                    const std::filesystem::path& directory) {
  auto read = readCase(all, index, clientType, directory);
  if (!read) return malformed("case[" + std::to_string(index) + "]." + read.error().text);
  return read;
}

std::int32_t clientTypeFor(const Dictionary& payload) {
  constexpr std::int32_t kFirst = 5, kLast = 11;
  const auto name = payload.text("name");
  for (std::int32_t type = kFirst; name && type <= kLast; ++type) {
    if (const auto storebag = storebagNameForClientType(type); storebag && *storebag == name->view())
      return type;
  }
  return kFirst;
}

}  // namespace vesk
