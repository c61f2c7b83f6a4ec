#include <map>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/plist/KeyedArchive.h"
#include "platform/plist/KeyedArchiveFormat.h"
#include "platform/plist/PropertyListFormats.h"

namespace vesk {

namespace {

class ArchiveWriter {
 public:
  ArchiveWriter() { _objects.emplace_back(Text::literal(archive::kNull)); }

  std::optional<std::string> write(const Value& root) {
    const Value reference = add(root, 1);
    const Dictionary document{{Text::literal(archive::kVersion), kKeyedArchiveVersion},
                              {Text::literal(archive::kArchiver), kKeyedArchiver},
                              {Text::literal(archive::kTop), Dictionary{{archive::kRoot, reference}}},
                              {Text::literal(archive::kObjects), List(std::move(_objects))}};
    return writeBinaryPropertyList(document, PropertyListFlavor::KeyedArchive);
  }

 private:
  static Value referenceTo(std::size_t index) {
    return Dictionary{{Text(kUIDKey), static_cast<std::uint64_t>(index)}};
  }

  Value append(Value object) {
    _objects.push_back(std::move(object));
    return referenceTo(_objects.size() - 1);
  }

  Value add(const Value& value, std::size_t depth) {
    switch (value.kind()) {
      case Value::Kind::None:
        return referenceTo(0);
      case Value::Kind::Text:
        return addText(*value.text());
      case Value::Kind::Bytes:
        return addObject(archive::kDataClass, {{Text::literal(archive::kBytes), *value.bytes()}});
      case Value::Kind::Date:
        return addObject(archive::kDateClass,
                         {{Text::literal(archive::kSeconds), value.date()->secondsSince1970}});
      case Value::Kind::List:
        return addShared(value.list()->begin(), archive::kListClass, depth,
                         [&](MutableDictionary& object) { fill(object, *value.list(), depth); });
      case Value::Kind::Dictionary:
        return addShared(value.dictionary()->begin(), archive::kDictionaryClass, depth,
                         [&](MutableDictionary& object) { fill(object, *value.dictionary(), depth); });
      default:
        return append(value);  // numbers are archived as they are
    }
  }

  Value addText(const Text& text) {
    auto [known, isNew] = _texts.try_emplace(text, _objects.size());
    if (!isNew) return referenceTo(known->second);
    if (text != archive::kNull) return append(text);
    return addObject(archive::kStringClass, {{Text::literal(archive::kText), text}});
  }

  Value addObject(const char* className, std::initializer_list<DictionaryEntry> entries) {
    const std::size_t index = _objects.size();
    _objects.emplace_back();
    _objects[index] = withClass(MutableDictionary(Dictionary(entries)), className);
    return referenceTo(index);
  }

  /// Adds a container, identified by the address of its contents. `fillIt` archives the contents.
  template <class Fill>
  Value addShared(const void* contents, const char* className, std::size_t depth, Fill fillIt) {
    if (depth > kDeepest) throw Unwritable();
    const std::size_t index = _objects.size();
    if (contents != nullptr) {
      auto [known, isNew] = _containers.try_emplace(contents, index);
      if (!isNew) return referenceTo(known->second);
    }
    _objects.emplace_back();  // reserves its index; its contents follow
    MutableDictionary object;
    fillIt(object);
    _objects[index] = withClass(std::move(object), className);
    return referenceTo(index);
  }

  void fill(MutableDictionary& object, const List& list, std::size_t depth) {
    std::vector<Value> items;
    for (const Value& value : list) items.push_back(add(value, depth + 1));
    object.append(Text::literal(archive::kItems), List(std::move(items)));
  }

  void fill(MutableDictionary& object, const Dictionary& dictionary, std::size_t depth) {
    std::vector<Value> keys, items;
    for (const auto& entry : dictionary) {
      keys.push_back(addText(entry.key));
      items.push_back(add(entry.value, depth + 1));
    }
    object.append(Text::literal(archive::kKeys), List(std::move(keys)));
    object.append(Text::literal(archive::kItems), List(std::move(items)));
  }

  Value withClass(MutableDictionary object, const char* className) {
    object.append(Text::literal(archive::kClass), classReference(className));
    return object.share();
  }

  Value classReference(const char* className) {
    auto [known, isNew] = _classes.try_emplace(className, _objects.size());
    if (!isNew) return referenceTo(known->second);
    return append(Dictionary{{Text::literal(archive::kClassName), className},
                             {Text::literal(archive::kClassChain), List{className, archive::kBaseClass}}});
  }

  static constexpr std::size_t kDeepest = PropertyListLimits{}.depth;
  std::vector<Value> _objects;
  std::unordered_map<Text, std::size_t> _texts;
  std::unordered_map<const void*, std::size_t> _containers;
  std::map<std::string_view, std::size_t> _classes;
};

}  // namespace

std::optional<std::string> archiveValue(const Value& root) {
  try {
    return ArchiveWriter().write(root);
  } catch (const Unwritable&) {
    return std::nullopt;
  }
}

}  // namespace vesk
