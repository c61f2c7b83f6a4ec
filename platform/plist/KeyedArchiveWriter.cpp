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
    auto reference = add(root, 1);
    if (!reference) return std::nullopt;
    const Dictionary document{{Text::literal(archive::kVersion), kKeyedArchiveVersion},
                              {Text::literal(archive::kArchiver), kKeyedArchiver},
                              {Text::literal(archive::kTop), Dictionary{{archive::kRoot, *reference}}},
                              {Text::literal(archive::kObjects), List(std::move(_objects))}};
    return writeBinaryPropertyList(document, PropertyListFlavor::KeyedArchive);
  }

 private:
  using Reference = std::optional<Value>;  // nullopt if nested too deeply

  static Value referenceTo(std::size_t index) {
    return Dictionary{{Text(kUIDKey), static_cast<std::uint64_t>(index)}};
  }

  Value append(Value object) {
    _objects.push_back(std::move(object));
    return referenceTo(_objects.size() - 1);
  }

  Reference add(const Value& value, std::size_t depth) {
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
                         [&](MutableDictionary& object) { return fill(object, *value.list(), depth); });
      case Value::Kind::Dictionary:
        return addShared(value.dictionary()->begin(), archive::kDictionaryClass, depth,
                         [&](MutableDictionary& object) { return fill(object, *value.dictionary(), depth); });
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
  Reference addShared(const void* contents, const char* className, std::size_t depth, Fill fillIt) {
    if (depth > kDeepest) return std::nullopt;
    const std::size_t index = _objects.size();
    if (contents != nullptr) {
      auto [known, isNew] = _containers.try_emplace(contents, index);
      if (!isNew) return referenceTo(known->second);
    }
    _objects.emplace_back();  // reserves its index; its contents follow
    MutableDictionary object;
    if (!fillIt(object)) return std::nullopt;
    _objects[index] = withClass(std::move(object), className);
    return referenceTo(index);
  }

  bool fill(MutableDictionary& object, const List& list, std::size_t depth) {
    std::vector<Value> items;
    for (const Value& value : list) {
      auto reference = add(value, depth + 1);
      if (!reference) return false;
      items.push_back(*std::move(reference));
    }
    object.append(Text::literal(archive::kItems), List(std::move(items)));
    return true;
  }

  bool fill(MutableDictionary& object, const Dictionary& dictionary, std::size_t depth) {
    std::vector<Value> keys, items;
    for (const auto& entry : dictionary) {
      keys.push_back(addText(entry.key));
      auto reference = add(entry.value, depth + 1);
      if (!reference) return false;
      items.push_back(*std::move(reference));
    }
    object.append(Text::literal(archive::kKeys), List(std::move(keys)));
    object.append(Text::literal(archive::kItems), List(std::move(items)));
    return true;
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

std::optional<std::string> archiveValue(const Value& root) { return ArchiveWriter().write(root); }

}  // namespace vesk
