#include "tools/text/Printable.h"

#include "platform/text/ASCII.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

std::string code(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return "\\x" + hexLower({&byte, 1});
}

/// U+0080 to U+009F, which terminals interpret as control characters like the first 32.
bool isSecondControlSet(std::string_view text) {
  return text.size() > 1 && text[0] == '\xc2' && static_cast<unsigned char>(text[1]) < 0xa0;
}

}  // namespace

std::string printable(std::string_view text) {
  const bool isUTF8 = isValidUTF8(text);
  std::string shown;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (isUTF8 && isSecondControlSet(text.substr(i))) {
      shown += code(text[i]) + code(text[i + 1]);
      ++i;
    } else if (isControl(text[i]) || (!isASCII(text[i]) && !isUTF8)) {
      shown += code(text[i]);
    } else {
      shown += text[i];
    }
  }
  return shown;
}

std::string printableUTF8(std::string_view bytes) {
  if (isValidUTF8(bytes)) return std::string(bytes);
  std::string shown;
  for (char c : bytes) shown += isASCII(c) ? c : '?';
  return shown;
}

}  // namespace vesk
