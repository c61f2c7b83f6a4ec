// Text from others, made fit to be shown.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// `text` with every control character, and whatever is not UTF-8, shown as \xNN, so that a peer can neither
/// forge a line nor steer a terminal.
std::string printable(std::string_view text);

/// JSON carries nothing but UTF-8: where `bytes` are none, "?" stands for each byte above 127.
std::string printableUTF8(std::string_view bytes);

}  // namespace vesk
