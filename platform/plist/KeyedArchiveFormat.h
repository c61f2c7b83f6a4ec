// The names used in keyed archives, for the writer and the reader.
#pragma once

#include <string_view>

namespace vesk::archive {

inline constexpr char kVersion[] = "$version";
inline constexpr char kArchiver[] = "$archiver";
inline constexpr char kTop[] = "$top";
inline constexpr char kObjects[] = "$objects";
inline constexpr char kRoot[] = "root";

/// The first object, which represents null.
inline constexpr char kNull[] = "$null";

/// The key of an object's reference to its class entry, and the keys in that entry.
inline constexpr char kClass[] = "$class";
inline constexpr char kClassName[] = "$classname";
inline constexpr char kClassChain[] = "$classes";

inline constexpr char kBaseClass[] = "Object";
inline constexpr char kListClass[] = "List";
inline constexpr char kDictionaryClass[] = "Dictionary";
inline constexpr char kDateClass[] = "Date";
inline constexpr char kDataClass[] = "Data";
inline constexpr char kStringClass[] = "String";

inline constexpr char kItems[] = "items";      // List: references; Dictionary: the values' references
inline constexpr char kKeys[] = "keys";        // Dictionary: references to texts, as many as items
inline constexpr char kSeconds[] = "seconds";  // Date: seconds since 1970, a real
inline constexpr char kBytes[] = "bytes";      // Data
inline constexpr char kText[] = "text";        // String: a text that would be mistaken for the null object

}  // namespace vesk::archive
