#include "tools/plist/KeyedArchiveReader.h"

#include <cmath>
#include <stdexcept>
#include <utility>
#include <vector>

#include "platform/plist/KeyedArchive.h"
#include "platform/plist/KeyedArchiveFormat.h"
#include "platform/plist/PropertyListFormats.h"
#include "platform/text/ASCII.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

/// Thrown for what is wrong with an archive.
struct Malformed {
  std::string why;
};

void require(const Result<void>& outcome) {
  if (!outcome) throw Malformed{outcome.error().text};
}

/// Reads the objects from the root down. Reads an object again for each reference to it.
class ArchiveReader {
 public:
  ArchiveReader(List objects, const PropertyListLimits& limits)
      : _objects(std::move(objects)), _budget(limits) {}

  Value read(const Value& reference, std::size_t depth = 1) {
    const std::size_t index = indexIn(&reference);
    const Value& archived = _objects[index];
    if (const Dictionary* instance = archived.dictionary()) return readInstance(*instance, depth);
    if (index == 0 && archived.text()) return leaf(Value());
    if (archived.text() || archived.isNumber()) return leaf(archived);
    throw Malformed{"an object that is neither text, number nor of a class"};
  }

 private:
  std::size_t indexIn(const Value* reference) const {
    const Dictionary* uid = reference != nullptr ? reference->dictionary() : nullptr;
    const Value* number = uid != nullptr && uid->size() == 1 ? uid->find(kUIDKey) : nullptr;
    const std::uint64_t* index = number != nullptr ? number->unsignedInteger() : nullptr;
    if (index == nullptr || *index >= _objects.size()) throw Malformed{"a reference to no object"};
    return *index;
  }

  Value leaf(const Value& value) {
    require(_budget.addLeaf(value));
    return value;
  }

  Value readInstance(const Dictionary& instance, std::size_t depth) {
    const Dictionary* entry = _objects[indexIn(instance.find(archive::kClass))].dictionary();
    const auto name = entry != nullptr ? entry->text(archive::kClassName) : std::nullopt;
    if (!name) throw Malformed{"an object without a class"};
    if (*name == archive::kListClass) return readItems(instance, depth);
    if (*name == archive::kDictionaryClass) return readEntries(instance, depth);
    const Value* date = instance.find(archive::kSeconds);
    if (*name == archive::kDateClass && date != nullptr && date->real()) return leaf(Date{*date->real()});
    const Value* data = instance.find(archive::kBytes);
    if (*name == archive::kDataClass && data != nullptr && data->bytes()) return leaf(*data);
    const auto text = instance.text(archive::kText);
    if (*name == archive::kStringClass && text) return leaf(*text);
    throw Malformed{"an object of an unknown class or form"};
  }

  List readItems(const Dictionary& instance, std::size_t depth) {
    auto items = instance.list(archive::kItems);
    if (!items) throw Malformed{"a list without items"};
    require(_budget.addContainer(depth));
    std::vector<Value> values;
    for (const Value& reference : *items) values.push_back(read(reference, depth + 1));
    return List(std::move(values));
  }

  Dictionary readEntries(const Dictionary& instance, std::size_t depth) {
    auto keys = instance.list(archive::kKeys);
    auto items = instance.list(archive::kItems);
    if (!keys || !items || keys->size() != items->size())
      throw Malformed{"a dictionary without keys and items"};
    require(_budget.addContainer(depth));
    MutableDictionary entries;
    for (std::size_t i = 0; i < keys->size(); ++i) {
      const Value key = read((*keys)[i], depth + 1);
      if (!key.text()) throw Malformed{"a key that is no text"};
      entries.append(*key.text(), read((*items)[i], depth + 1));
    }
    return entries.shareUnique();
  }

  const List _objects;
  PropertyListBudget _budget;
};

Value unarchived(const Value& root, const PropertyListLimits& limits) {
  const Dictionary* document = root.dictionary();
  if (document == nullptr) throw Malformed{"no keyed archive: its root is no dictionary"};
  auto archiver = document->text(archive::kArchiver);
  if (!archiver || archiver->view() != kKeyedArchiver)
    throw Malformed{"no keyed archive: another archiver made it"};
  if (integerForKey(*document, archive::kVersion) != kKeyedArchiveVersion)
    throw Malformed{"no keyed archive: it is of another version"};
  auto objects = document->list(archive::kObjects);
  auto top = document->dictionary(archive::kTop);
  const Value* reference = top ? top->find(archive::kRoot) : nullptr;
  if (!objects || objects->empty() || reference == nullptr)
    throw Malformed{"no keyed archive: it has no objects or no root"};
  return ArchiveReader(*objects, limits).read(*reference);
}

constexpr std::size_t kShownOfData = 64;                 // bytes
constexpr double kLongestCivilTime = 8'000'000'000'000;  // seconds either side of 1970

std::string dateText(Date date) {
  if (!(std::abs(date.secondsSince1970) < kLongestCivilTime)) return "no date";
  const double seconds = std::floor(date.secondsSince1970);
  const WallTime time{std::chrono::seconds(static_cast<std::int64_t>(seconds))};
  return civilTime(time) + fractionText(static_cast<int>((date.secondsSince1970 - seconds) * 1000)) + " UTC";
}

std::string dataText(std::string_view bytes) {
  std::string text = std::to_string(bytes.size()) + " bytes:";
  for (unsigned char c : bytes.substr(0, kShownOfData)) text += " " + hexLower({&c, 1});
  return bytes.size() > kShownOfData ? text + " …" : text;
}

/// Appends `value`, which starts in the middle of a line, and the lines of its contents.
void print(const Value& value, std::size_t indent, std::string& out) {
  const auto begin = [&](const std::string& name, const Value& item) {
    out.append(2 * (indent + 1), ' ').append(name);
    print(item, indent + 1, out);
  };
  if (const List* list = value.list()) {
    out += "list of " + std::to_string(list->size()) + "\n";
    for (const Value& item : *list) begin("- ", item);
  } else if (const Dictionary* dictionary = value.dictionary()) {
    out += "dictionary of " + std::to_string(dictionary->size()) + "\n";
    for (const auto& entry : *dictionary) begin(printable(entry.key.view()) + " = ", entry.value);
  } else if (const Date* date = value.date()) {
    out += dateText(*date) + "\n";
  } else if (const Bytes* bytes = value.bytes()) {
    out += dataText(bytes->view()) + "\n";
  } else {
    out += printable(describe(value, SIZE_MAX)) + "\n";
  }
}

}  // namespace

Result<Value> unarchiveValue(std::string_view bytes, const PropertyListLimits& limits) {
  if (!bytes.starts_with(kBinaryPropertyListMagic))
    return malformed("no keyed archive: it is no binary property list");
  auto parsed = parsePropertyList(bytes, PropertyListFlavor::KeyedArchive, limits);
  if (!parsed) return parsed;
  try {
    return unarchived(*parsed, limits);
  } catch (const Malformed& archive) {
    return malformed(archive.why);
  }
}

PropertyListLimits archiveLimits() {
  PropertyListLimits limits;
  limits.bytes = std::size_t{64} << 20;
  limits.nodes = 5'000'000;
  limits.contentBytes = std::size_t{256} << 20;
  return limits;
}

std::string archiveText(std::string_view archive) {
  auto value = unarchiveValue(archive, archiveLimits());
  if (!value) throw std::runtime_error(value.error().text);
  std::string text;
  print(*value, 0, text);
  return text;
}

}  // namespace vesk
