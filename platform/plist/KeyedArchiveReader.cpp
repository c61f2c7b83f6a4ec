#include <utility>

#include "platform/plist/KeyedArchive.h"
#include "platform/plist/KeyedArchiveFormat.h"
#include "platform/plist/ObjectGraphReader.h"

namespace vesk {

namespace {

class ArchiveReader final : private ObjectGraphReader {
 public:
  ArchiveReader(List objects, const PropertyListLimits& limits)
      : ObjectGraphReader(limits), _objects(std::move(objects)) {}

  PropertyListOutcome read(const Value& reference) { return readFrom(indexIn(&reference)); }

 private:
  std::optional<Index> indexIn(const Value* reference) {
    const Dictionary* uid = reference != nullptr ? reference->dictionary() : nullptr;
    const Value* number = uid != nullptr && uid->size() == 1 ? uid->find(kUIDKey) : nullptr;
    const std::uint64_t* index = number != nullptr ? number->unsignedInteger() : nullptr;
    if (index != nullptr && *index < _objects.size()) return *index;
    fail("a reference to no object");
    return std::nullopt;
  }

  bool readObject(Index index, std::size_t depth, Object& object) override {
    const Value& archived = _objects[index];
    if (const Dictionary* instance = archived.dictionary()) return readInstance(*instance, depth, object);
    if (index == 0 && archived.text()) return readLeaf(Value(), object);
    if (archived.text() || archived.isNumber()) return readLeaf(archived, object);
    return fail("an object that is neither text, number nor of a class");
  }

  bool readInstance(const Dictionary& instance, std::size_t depth, Object& object) {
    const std::optional<Text> name = classOf(instance);
    if (!name) return fail("an object without a class");
    if (*name == archive::kListClass) return readItems(instance, depth, object);
    if (*name == archive::kDictionaryClass) return readEntries(instance, depth, object);
    const Value* date = instance.find(archive::kSeconds);
    if (*name == archive::kDateClass && date != nullptr && date->real() != nullptr) {
      return readLeaf(Date{*date->real()}, object);
    }
    const Value* data = instance.find(archive::kBytes);
    if (*name == archive::kDataClass && data != nullptr && data->bytes() != nullptr) {
      return readLeaf(*data, object);
    }
    auto text = instance.text(archive::kText);
    if (*name != archive::kStringClass || !text) return fail("an object of an unknown class or form");
    return readLeaf(*text, object);
  }

  std::optional<Text> classOf(const Dictionary& instance) {
    auto index = indexIn(instance.find(archive::kClass));
    if (!index) return std::nullopt;
    const Dictionary* entry = _objects[*index].dictionary();
    return entry != nullptr ? entry->text(archive::kClassName) : std::nullopt;
  }

  PartAt referencesOf(const List& references) {
    return [&](std::size_t place) { return indexIn(&references[place]); };
  }

  bool readItems(const Dictionary& instance, std::size_t depth, Object& list) {
    auto items = instance.list(archive::kItems);
    if (!items) return fail("a list without items");
    return readList(items->size(), referencesOf(*items), depth, list);
  }

  bool readEntries(const Dictionary& instance, std::size_t depth, Object& dictionary) {
    auto keys = instance.list(archive::kKeys);
    auto items = instance.list(archive::kItems);
    if (!keys || !items || keys->size() != items->size()) return fail("a dictionary without keys and items");
    return readDictionary(keys->size(), referencesOf(*keys), referencesOf(*items), depth, dictionary);
  }

  const List _objects;
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
