// Makes untrusted text safe to show.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// Returns `text` with control characters and invalid UTF-8 as \xNN, so that a peer can neither forge a line
/// nor control a terminal.
std::string printable(std::string_view text);

/// Returns `bytes` for use in JSON: if they are not valid UTF-8, "?" replaces each byte above 127.
std::string printableUTF8(std::string_view bytes);

}  // namespace vesk
