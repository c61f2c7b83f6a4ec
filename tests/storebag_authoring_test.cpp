// The pages and the schema for people who write storebags.
#include <gtest/gtest.h>

#include <fstream>
#include <iterator>

#include "platform/preferences/TomlFile.h"
#include "tools/json/JSONReader.h"
#include "tools/storebag/StorebagKeys.h"
#include "tools/storebag/StorebagReference.h"

namespace vesk {
namespace {

std::string fileNamed(const char* name) {
  std::ifstream in(std::string(VESK_SOURCE_DIRECTORY "/") + name, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

TEST(StorebagReference, IsWhatThePagesSay) {
  EXPECT_TRUE(fileNamed("docs/storebag.md").ends_with("\n" + storebagReferenceAsMarkdown()))
      << "replace the end of docs/storebag.md by the output of `veskreport storebag reference`";
  EXPECT_NE(fileNamed("packaging/man/veskreport-storebag.5").find("\n" + storebagReferenceAsMdoc() + ".Sh "),
            std::string::npos)
      << "replace the section KEYS by the output of `veskreport storebag reference --man`";
}

TEST(StorebagReference, HasEverySettingInTheInstalledSamples) {
  const struct {
    const char* file;
    std::span<const StorebagKey> keys;
  } samples[] = {{"packaging/device.toml", deviceFactKeys()},
                 {"packaging/preferences/com.corvane.veskreporting.toml", preferenceKeys()}};
  for (const auto& [file, keys] : samples) {
    const std::string sample = fileNamed(file);
    const auto active = parseToml(sample);
    ASSERT_TRUE(active) << file;
    for (const auto& key : keys) {
      const bool isSet = key.key == "keepStorebags";  // a device may start without a network
      EXPECT_EQ(active->contains(key.key), isSet) << key.key;
      const std::string line = std::string(key.key) + " = " + std::string(key.example) + "\n";
      EXPECT_NE(sample.find((isSet ? "\n" : "\n#") + line), std::string::npos) << file << ": " << key.key;
    }
  }
}

TEST(StorebagReference, SaysSomethingOfEveryKey) {
  for (const auto& group : storebagKeyGroups()) {
    for (const auto& key : group.keys) {
      EXPECT_FALSE(key.effect.empty() || key.absent.empty()) << key.key;
      EXPECT_TRUE(key.effect.ends_with(".")) << key.key;
      if (key.example.empty()) continue;
      const auto example = parseToml("value = " + std::string(key.example));
      EXPECT_TRUE(example && hasType(*example->find("value"), key.type)) << key.key;
    }
  }
}

/// The schema of a key, by its path in the storebag; "[]" is a list's item.
Dictionary schemaAt(const std::vector<const char*>& path) {
  const auto schema = parseJSON(storebagSchema(), 64);
  EXPECT_TRUE(schema && schema->dictionary());
  Dictionary at = schema->dictionary()->dictionary("definitions")->dictionary("section").value();
  for (const std::string key : path)
    at = key == "[]" ? at.dictionary("items").value()
                     : at.dictionary("properties").value().dictionary(key).value();
  return at;
}

TEST(StorebagSchema, HasTypesLimitsAndDefaultsOfTheKeys) {
  const std::vector<const char*> entry{"httpPost", "clients", "[]"};
  auto with = [&](const char* key) {
    auto path = entry;
    path.push_back(key);
    return schemaAt(path);
  };
  EXPECT_EQ(describe(*with("event_threshold").find("default")), "49");
  EXPECT_EQ(describe(*with("sampling_threshold").find("maximum")), "1");
  EXPECT_EQ(describe(*schemaAt({"dashboard"}).find("required")), R"(["ip", "port"])");
  EXPECT_EQ(describe(*schemaAt(entry).find("additionalProperties")), "false");
  EXPECT_EQ(describe(*schemaAt({"httpPost2", "clients", "[]", "filters", "[]", "action"}).find("enum")),
            R"(["remove", "sha256"])");
}

}  // namespace
}  // namespace vesk
