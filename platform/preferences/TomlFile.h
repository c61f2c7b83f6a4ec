// TOML documents as values.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/files/TrustedFile.h"

namespace vesk {

/// A document, or what is wrong with it (with line and column).
struct TomlOutcome {
  std::optional<Dictionary> document;
  std::string error;
};

/// Reads a TOML document of at most 1 MiB. Strings, integers, floats, booleans, arrays and tables become the
/// values of those kinds. A date, or a date with time, becomes a date, taken as UTC when it names no offset;
/// a time of day alone becomes its text. Arrays and inline tables may nest 32 deep, and a key may have 7
/// parts: what reads this may stand on a small stack.
TomlOutcome parseToml(std::string_view text);

/// The document of the file at `path` (no root prefix is added), which has to be trusted (TrustedFile.h). A
/// missing file is an empty document. One that is refused, can't be read or is no TOML costs one level-4 line
/// that names it, and is an empty document too.
Dictionary readTomlFile(const std::string& path, TrustedOwner owner = TrustedOwner::Root);

}  // namespace vesk
