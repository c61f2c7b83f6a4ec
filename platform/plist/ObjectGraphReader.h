// Values out of documents whose objects refer to each other by number. Private to platform/plist.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <unordered_map>

#include "platform/plist/PropertyListFormats.h"

namespace vesk {

/// Reads objects as they are reached from the root. Each is read once and shared from then on, but counts in
/// full wherever it is referred to.
class ObjectGraphReader {
 protected:
  using Index = std::uint64_t;

  struct Object {
    Value value;
    bool isComplete = false;       // false while its own parts are being read
    std::size_t height = 0;        // containers down from here, itself included
    std::size_t nodes = 1;         // everything below and itself
    std::size_t contentBytes = 0;  // of all texts and data in it
  };

  /// Which object a container has in its `place`; nothing after a failure.
  using PartAt = std::function<std::optional<Index>(std::size_t place)>;

  explicit ObjectGraphReader(const PropertyListLimits& limits) : _budget(limits) {}
  ~ObjectGraphReader() = default;

  PropertyListOutcome readFrom(std::optional<Index> root);

  /// Reads what stands at `depth` into `object`, by one of the functions below. They return false after a
  /// failure, as this must.
  virtual bool readObject(Index index, std::size_t depth, Object& object) = 0;

  /// `value` has no parts that count.
  bool readLeaf(Value value, Object& object);
  bool readList(std::size_t count, const PartAt& itemAt, std::size_t depth, Object& list);
  bool readDictionary(std::size_t count, const PartAt& keyAt, const PartAt& itemAt, std::size_t depth,
                      Object& dictionary);

  /// Keeps the first error. Returns false.
  bool fail(std::string error);

 private:
  bool countAgain(const Object& object, std::size_t depth);
  bool beginContainer(std::size_t depth, Object& container);
  const Object* object(std::optional<Index> index, std::size_t depth);
  const Object* part(std::optional<Index> index, std::size_t depth, Object& container);

  PropertyListBudget _budget;
  std::unordered_map<Index, Object> _read;
  std::string _error;
};

}  // namespace vesk
