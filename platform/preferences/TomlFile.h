// Reads TOML documents as values.
#pragma once

#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/files/TrustedFile.h"

namespace vesk {

/// Reads a TOML document of at most 1 MiB. Strings, integers, floats, booleans, arrays and tables become
/// values of those kinds. A date with or without a time becomes a date, in UTC unless it has an offset; a
/// time of day alone becomes its text. Arrays and inline tables may nest 32 deep, and a key may have 7 parts,
/// so that a small stack suffices. Errors in the text have line and column.
Result<Dictionary> parseToml(std::string_view text);

/// Reads the file at `path`, without adding the root prefix. The file must be trusted (TrustedFile.h). A
/// missing file gives an empty document. An untrusted, unreadable or malformed file also does, with one
/// level-4 line that names it.
Dictionary readTomlFile(const std::string& path, TrustedOwner owner = TrustedOwner::Root);

}  // namespace vesk
