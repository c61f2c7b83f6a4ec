#include <algorithm>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/plist/KeyedArchive.h"
#include "platform/plist/KeyedArchiveFormat.h"
#include "platform/plist/PropertyListFormats.h"

namespace vesk {

namespace {

/// Reads objects as they are reached from the root, each once; but it counts wherever it is referred to.
class ArchiveReader {
 public:
  ArchiveReader(List objects, const PropertyListLimits& limits)
      : _objects(std::move(objects)), _budget(limits) {}

  PropertyListOutcome read(const Value& reference) {
    const Object* root = object(reference, 1);
    if (root == nullptr) return {std::nullopt, _error};
    return {root->value, {}};
  }

 private:
  struct Object {
    Value value;
    bool isComplete = false;  // false while its own parts are being read
    std::size_t height = 0;   // containers down from here, itself included
    std::size_t nodes = 1;    // everything below and itself
    std::size_t contentBytes = 0;
  };

  bool fail(std::string error) {
    if (_error.empty()) _error = std::move(error);
    return false;
  }
  const Object* failed(std::string error) {
    fail(std::move(error));
    return nullptr;
  }

  std::optional<std::size_t> indexIn(const Value* reference) {
    const Dictionary* uid = reference != nullptr ? reference->dictionary() : nullptr;
    const Value* number = uid != nullptr && uid->size() == 1 ? uid->find(kUIDKey) : nullptr;
    const std::uint64_t* index = number != nullptr ? number->unsignedInteger() : nullptr;
    if (index != nullptr && *index < _objects.size()) return *index;
    fail("a reference to no object");
    return std::nullopt;
  }

  /// The object as it stands at `depth`, or null after a failure.
  const Object* object(const Value& reference, std::size_t depth) {
    auto index = indexIn(&reference);
    if (!index) return nullptr;
    auto [at, isNew] = _read.try_emplace(*index);
    Object& object = at->second;  // stays where it is when more are added
    if (isNew) {
      if (!readObject(*index, depth, object)) return nullptr;
      object.isComplete = true;
      return &object;
    }
    if (!object.isComplete) return failed("an object that holds itself");
    if (!_budget.allowsDepth(depth + std::max<std::size_t>(object.height, 1) - 1))
      return failed(_budget.depthError());
    if (!_budget.add(object.nodes, object.contentBytes)) return failed(_budget.sizeError());
    return &object;
  }

  bool readObject(std::size_t index, std::size_t depth, Object& object) {
    const Value& archived = _objects[index];
    if (const Dictionary* instance = archived.dictionary()) return readInstance(*instance, depth, object);
    if (const Text* text = archived.text()) {
      if (index != 0) object.value = *text;
      return add(object, index == 0 ? 0 : text->size());
    }
    if (!archived.isNumber()) return fail("an object that is neither text, number nor of a class");
    object.value = archived;
    return add(object, 0);
  }

  bool add(Object& object, std::size_t contentBytes) {
    object.contentBytes += contentBytes;
    return _budget.add(1, contentBytes) || fail(_budget.sizeError());
  }

  bool readInstance(const Dictionary& instance, std::size_t depth, Object& object) {
    const std::optional<Text> name = classOf(instance);
    if (!name) return fail("an object without a class");
    if (*name == archive::kListClass) return readList(instance, depth, object);
    if (*name == archive::kDictionaryClass) return readDictionary(instance, depth, object);
    const Value* date = instance.find(archive::kSeconds);
    if (*name == archive::kDateClass && date != nullptr && date->real() != nullptr) {
      object.value = Date{*date->real()};
      return add(object, 0);
    }
    const Value* data = instance.find(archive::kBytes);
    if (*name == archive::kDataClass && data != nullptr && data->bytes() != nullptr) {
      object.value = *data->bytes();
      return add(object, data->bytes()->size());
    }
    auto text = instance.text(archive::kText);
    if (*name != archive::kStringClass || !text) return fail("an object of an unknown class or form");
    object.value = *text;
    return add(object, text->size());
  }

  std::optional<Text> classOf(const Dictionary& instance) {
    auto index = indexIn(instance.find(archive::kClass));
    if (!index) return std::nullopt;
    const Dictionary* entry = _objects[*index].dictionary();
    return entry != nullptr ? entry->text(archive::kClassName) : std::nullopt;
  }

  /// The `index`th object that a container refers to; its cost becomes the container's as well.
  const Object* part(const Value& reference, std::size_t depth, Object& container) {
    const Object* found = object(reference, depth + 1);
    if (found == nullptr) return nullptr;
    container.nodes += found->nodes;
    container.contentBytes += found->contentBytes;
    container.height = std::max(container.height, found->height + 1);
    return found;
  }

  bool beginContainer(std::size_t depth, Object& container) {
    container.height = 1;
    if (!_budget.allowsDepth(depth)) return fail(_budget.depthError());
    return add(container, 0);
  }

  bool readList(const Dictionary& instance, std::size_t depth, Object& list) {
    auto items = instance.list(archive::kItems);
    if (!items) return fail("a list without items");
    if (!beginContainer(depth, list)) return false;
    std::vector<Value> values;
    for (const Value& reference : *items) {
      const Object* item = part(reference, depth, list);
      if (item == nullptr) return false;
      values.push_back(item->value);
    }
    list.value = List(std::move(values));
    return true;
  }

  bool readDictionary(const Dictionary& instance, std::size_t depth, Object& dictionary) {
    auto keys = instance.list(archive::kKeys);
    auto items = instance.list(archive::kItems);
    if (!keys || !items || keys->size() != items->size()) return fail("a dictionary without keys and items");
    if (!beginContainer(depth, dictionary)) return false;
    MutableDictionary entries;
    for (std::size_t i = 0; i < keys->size(); ++i) {
      const Object* key = part((*keys)[i], depth, dictionary);
      if (key == nullptr) return false;
      if (key->value.text() == nullptr) return fail("a key that is no text");
      const Text name = *key->value.text();
      const Object* item = part((*items)[i], depth, dictionary);
      if (item == nullptr) return false;
      entries.append(name, item->value);
    }
    dictionary.value = entries.shareUnique();
    return true;
  }

  const List _objects;
  PropertyListBudget _budget;
  std::unordered_map<std::size_t, Object> _read;
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
