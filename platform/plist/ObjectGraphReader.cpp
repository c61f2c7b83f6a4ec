#include "platform/plist/ObjectGraphReader.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace vesk {

namespace {

// Containers may lie across each other, so that a small document could ask for a lot of room at once.
std::size_t roomFor(std::size_t count) { return std::min<std::size_t>(count, 1024); }

}  // namespace

PropertyListOutcome ObjectGraphReader::readFrom(std::optional<Index> root) {
  const Object* found = object(root, 1);
  if (!found) return {std::nullopt, _error};
  return {found->value, {}};
}

bool ObjectGraphReader::fail(std::string error) {
  if (_error.empty()) _error = std::move(error);
  return false;
}

/// The object as it stands at `depth`, or null after a failure.
const ObjectGraphReader::Object* ObjectGraphReader::object(std::optional<Index> index, std::size_t depth) {
  if (!index) return nullptr;
  auto [at, isNew] = _read.try_emplace(*index);
  Object& object = at->second;  // stays where it is when more are added
  if (isNew ? !readObject(*index, depth, object) : !countAgain(object, depth)) return nullptr;
  object.isComplete = true;
  return &object;
}

bool ObjectGraphReader::countAgain(const Object& object, std::size_t depth) {
  if (!object.isComplete) return fail("an object that holds itself");
  if (!_budget.allowsDepth(depth + object.height - 1)) return fail(_budget.depthError());
  return _budget.add(object.nodes, object.contentBytes) || fail(_budget.sizeError());
}

/// One that a container refers to; its cost becomes the container's as well.
const ObjectGraphReader::Object* ObjectGraphReader::part(std::optional<Index> index, std::size_t depth,
                                                         Object& container) {
  const Object* found = object(index, depth + 1);
  if (!found) return nullptr;
  container.nodes += found->nodes;
  container.contentBytes += found->contentBytes;
  container.height = std::max(container.height, found->height + 1);
  return found;
}

bool ObjectGraphReader::readLeaf(Value value, Object& object) {
  if (const Text* text = value.text()) object.contentBytes = text->size();
  if (const Bytes* bytes = value.bytes()) object.contentBytes = bytes->size();
  object.value = std::move(value);
  return _budget.add(1, object.contentBytes) || fail(_budget.sizeError());
}

bool ObjectGraphReader::beginContainer(std::size_t depth, Object& container) {
  container.height = 1;
  if (!_budget.allowsDepth(depth)) return fail(_budget.depthError());
  return _budget.add(1, 0) || fail(_budget.sizeError());
}

bool ObjectGraphReader::readList(std::size_t count, const PartAt& itemAt, std::size_t depth, Object& list) {
  if (!beginContainer(depth, list)) return false;
  std::vector<Value> values;
  values.reserve(roomFor(count));
  for (std::size_t i = 0; i < count; ++i) {
    const Object* item = part(itemAt(i), depth, list);
    if (!item) return false;
    values.push_back(item->value);
  }
  list.value = List(std::move(values));
  return true;
}

bool ObjectGraphReader::readDictionary(std::size_t count, const PartAt& keyAt, const PartAt& itemAt,
                                       std::size_t depth, Object& dictionary) {
  if (!beginContainer(depth, dictionary)) return false;
  MutableDictionary entries;
  entries.reserve(roomFor(count));
  for (std::size_t i = 0; i < count; ++i) {
    const Object* key = part(keyAt(i), depth, dictionary);
    if (!key) return false;
    if (!key->value.text()) return fail("a key that is no text");
    const Object* item = part(itemAt(i), depth, dictionary);
    if (!item) return false;
    entries.append(*key->value.text(), item->value);
  }
  dictionary.value = entries.shareUnique();
  return true;
}

}  // namespace vesk
