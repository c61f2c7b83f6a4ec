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

  Result<Value> read(const Value& reference) { return readObject(reference, 1); }

 private:
  Result<std::uint64_t> indexIn(const Value* reference) {
    const Dictionary* uid = reference != nullptr ? reference->dictionary() : nullptr;
    const Value* number = uid != nullptr && uid->size() == 1 ? uid->find(kUIDKey) : nullptr;
    const std::uint64_t* index = number != nullptr ? number->unsignedInteger() : nullptr;
    if (index == nullptr || *index >= _objects.size()) return malformed("a reference to no object");
    return *index;
  }

  Result<Value> readObject(const Value& reference, std::size_t depth) {
    auto index = indexIn(&reference);
    if (!index) return index.error();
    const Value& archived = _objects[*index];
    if (const Dictionary* instance = archived.dictionary()) return readInstance(*instance, depth);
    if (*index == 0 && archived.text()) return leaf(Value());
    if (archived.text() || archived.isNumber()) return leaf(archived);
    return malformed("an object that is neither text, number nor of a class");
  }

  Result<Value> leaf(const Value& value) {
    if (auto added = _budget.addLeaf(value); !added) return added.error();
    return value;
  }

  Result<Value> readInstance(const Dictionary& instance, std::size_t depth) {
    const auto name = classOf(instance);
    if (!name) return name.error();
    if (*name == archive::kListClass) return readItems(instance, depth);
    if (*name == archive::kDictionaryClass) return readEntries(instance, depth);
    const Value* date = instance.find(archive::kSeconds);
    if (*name == archive::kDateClass && date != nullptr && date->real()) return leaf(Date{*date->real()});
    const Value* data = instance.find(archive::kBytes);
    if (*name == archive::kDataClass && data != nullptr && data->bytes()) return leaf(*data);
    const auto text = instance.text(archive::kText);
    if (*name != archive::kStringClass || !text) return malformed("an object of an unknown class or form");
    return leaf(*text);
  }

  Result<Text> classOf(const Dictionary& instance) {
    auto index = indexIn(instance.find(archive::kClass));
    if (!index) return index.error();
    const Dictionary* entry = _objects[*index].dictionary();
    auto name = entry != nullptr ? entry->text(archive::kClassName) : std::nullopt;
    if (!name) return malformed("an object without a class");
    return *std::move(name);
  }

  Result<Value> readItems(const Dictionary& instance, std::size_t depth) {
    auto items = instance.list(archive::kItems);
    if (!items) return malformed("a list without items");
    if (auto added = _budget.addContainer(depth); !added) return added.error();
    std::vector<Value> values;
    for (const Value& reference : *items) {
      auto value = readObject(reference, depth + 1);
      if (!value) return value;
      values.push_back(*std::move(value));
    }
    return List(std::move(values));
  }

  Result<Value> readEntries(const Dictionary& instance, std::size_t depth) {
    auto keys = instance.list(archive::kKeys);
    auto items = instance.list(archive::kItems);
    if (!keys || !items || keys->size() != items->size())
      return malformed("a dictionary without keys and items");
    if (auto added = _budget.addContainer(depth); !added) return added.error();
    MutableDictionary entries;
    for (std::size_t i = 0; i < keys->size(); ++i) {
      auto key = readObject((*keys)[i], depth + 1);
      if (key && !key->text()) return malformed("a key that is no text");
      auto item = key ? readObject((*items)[i], depth + 1) : key;
      if (!item) return item;
      entries.append(*key->text(), *std::move(item));
    }
    return entries.shareUnique();
  }

  const List _objects;
  PropertyListBudget _budget;
};

Error noArchive(const std::string& why) { return malformed("no keyed archive: " + why); }

}  // namespace

Result<Value> unarchiveValue(std::string_view bytes, const PropertyListLimits& limits) {
  if (!bytes.starts_with(kBinaryPropertyListMagic)) return noArchive("it is no binary property list");
  auto parsed = parsePropertyList(bytes, PropertyListFlavor::KeyedArchive, limits);
  if (!parsed) return parsed;
  const Dictionary* document = parsed->dictionary();
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
