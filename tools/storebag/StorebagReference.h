// Pages and a schema made from the list of keys.
#pragma once

#include <string>

namespace vesk {

/// The tables of docs/storebag.md: every key, the environments and the client types.
std::string storebagReferenceAsMarkdown();

/// The same as sections of veskreport-storebag(5).
std::string storebagReferenceAsMdoc();

/// A JSON Schema (draft 7) of a storebag's source, for editors.
std::string storebagSchema();

}  // namespace vesk
