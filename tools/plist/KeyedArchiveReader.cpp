#include "tools/plist/KeyedArchiveReader.h"

#include <utility>
#include <vector>

#include "platform/plist/KeyedArchive.h"
#include "platform/plist/KeyedArchiveFormat.h"
#include "platform/plist/PropertyListFormats.h"

namespace vesk {

namespace {

/// Reads the objects from the root down. Reads an object again for each reference to it.
class ArchiveReader {
 public:
  ArchiveReader(List objects, const PropertyListLimits& limits)
      : _objects(std::move(objects)), _budget(limits) {}

  PropertyListOutcome read(const Value& reference) {
    auto root = readObject(reference, 1);
    if (!root) return {std::nullopt, _error};
    return {std::move(root), {}};
  }

 private:
  /// Keeps only the first error.
  std::nullopt_t fail(std::string error) {
    if (_error.empty()) _error = std::move(error);
    return std::nullopt;
  }

  std::optional<std::uint64_t> indexIn(const Value* reference) {
    const Dictionary* uid = reference != nullptr ? reference->dictionary() : nullptr;
    const Value* number = uid != nullptr && uid->size() == 1 ? uid->find(kUIDKey) : nullptr;
    const std::uint64_t* index = number != nullptr ? number->unsignedInteger() : nullptr;
    if (index == nullptr || *index >= _objects.size()) return fail("a reference to no object");
    return *index;
  }

  std::optional<Value> readObject(const Value& reference, std::size_t depth) {
    auto index = indexIn(&reference);
    if (!index) return std::nullopt;
    const Value& archived = _objects[*index];
    if (const Dictionary* instance = archived.dictionary()) return readInstance(*instance, depth);
    if (*index == 0 && archived.text()) return leaf(Value());
    if (archived.text() || archived.isNumber()) return leaf(archived);
    return fail("an object that is neither text, number nor of a class");
  }

  std::optional<Value> leaf(const Value& value) {
    if (!_budget.addLeaf(value)) return fail(_budget.error());
    return value;
  }

  std::optional<Value> readInstance(const Dictionary& instance, std::size_t depth) {
    const std::optional<Text> name = classOf(instance);
    if (!name) return fail("an object without a class");
    if (*name == archive::kListClass) return readItems(instance, depth);
    if (*name == archive::kDictionaryClass) return readEntries(instance, depth);
    const Value* date = instance.find(archive::kSeconds);
    if (*name == archive::kDateClass && date != nullptr && date->real()) return leaf(Date{*date->real()});
    const Value* data = instance.find(archive::kBytes);
    if (*name == archive::kDataClass && data != nullptr && data->bytes()) return leaf(*data);
    const auto text = instance.text(archive::kText);
    if (*name != archive::kStringClass || !text) return fail("an object of an unknown class or form");
    return leaf(*text);
  }

  std::optional<Text> classOf(const Dictionary& instance) {
    auto index = indexIn(instance.find(archive::kClass));
    if (!index) return std::nullopt;
    const Dictionary* entry = _objects[*index].dictionary();
    return entry != nullptr ? entry->text(archive::kClassName) : std::nullopt;
  }

  std::optional<Value> readItems(const Dictionary& instance, std::size_t depth) {
    auto items = instance.list(archive::kItems);
    if (!items) return fail("a list without items");
    if (!_budget.addContainer(depth)) return fail(_budget.error());
    std::vector<Value> values;
    for (const Value& reference : *items) {
      auto value = readObject(reference, depth + 1);
      if (!value) return std::nullopt;
      values.push_back(*std::move(value));
    }
    return List(std::move(values));
  }

  std::optional<Value> readEntries(const Dictionary& instance, std::size_t depth) {
    auto keys = instance.list(archive::kKeys);
    auto items = instance.list(archive::kItems);
    if (!keys || !items || keys->size() != items->size()) return fail("a dictionary without keys and items");
    if (!_budget.addContainer(depth)) return fail(_budget.error());
    MutableDictionary entries;
    for (std::size_t i = 0; i < keys->size(); ++i) {
      auto key = readObject((*keys)[i], depth + 1);
      if (key && !key->text()) return fail("a key that is no text");
      auto item = key ? readObject((*items)[i], depth + 1) : std::nullopt;
      if (!item) return std::nullopt;
      entries.append(*key->text(), *std::move(item));
    }
    return entries.shareUnique();
  }

  const List _objects;
  PropertyListBudget _budget;
  std::string _error;
};

PropertyListOutcome noArchive(std::string why) { return {std::nullopt, "no keyed archive: " + why}; }

}  // namespace

PropertyListOutcome unarchiveValue(std::string_view bytes, const PropertyListLimits& limits) {
  if (!bytes.starts_with(kBinaryPropertyListMagic)) return noArchive("it is no binary property list");
  auto parsed = parsePropertyList(bytes, PropertyListFlavor::KeyedArchive, limits);
  if (!parsed.value) return parsed;
  const Dictionary* document = parsed.value->dictionary();
  if (document == nullptr) return noArchive("its root is no dictionary");
  auto archiver = document->text(archive::kArchiver);
  if (!archiver || archiver->view() != kKeyedArchiver) return noArchive("another archiver made it");
  if (integerForKey(*document, archive::kVersion) != kKeyedArchiveVersion)
    return noArchive("it is of another version");
  auto objects = document->list(archive::kObjects);
  auto top = document->dictionary(archive::kTop);
  const Value* root = top ? top->find(archive::kRoot) : nullptr;
  if (!objects || objects->empty() || root == nullptr) return noArchive("it has no objects or no root");
  return ArchiveReader(*objects, limits).read(*root);
}

}  // namespace vesk
