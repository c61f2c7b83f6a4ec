// An adaptor that writes each message as a line of JSON to wren.jsonl in the daemon's state directory.
#include <VeskReporting/WrenAdaptor.h>
#include <fcntl.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <memory>
#include <string>

namespace {

// The adaptor's structure begins with the part that the daemon uses.
struct JSONLines {
  VeskWrenAdaptor base;
  int file;
};

void append(std::string& out, const VeskDictionaryView& dictionary);

void appendText(std::string& out, const VeskTextView& text) {
  out += '"';
  for (size_t i = 0; i < text.length; ++i) {
    const char c = text.data[i];
    if (c == '"' || c == '\\') {
      (out += '\\') += c;
    } else if (static_cast<unsigned char>(c) < 0x20) {
      char escaped[8];
      std::snprintf(escaped, sizeof escaped, "\\u%04x", static_cast<unsigned>(c));
      out += escaped;
    } else {
      out += c;
    }
  }
  out += '"';
}

void appendNumber(std::string& out, double number) {
  char text[32];
  std::snprintf(text, sizeof text, "%.17g", number);
  out += std::isfinite(number) ? text : "null";
}

void append(std::string& out, const VeskListView& list);

void append(std::string& out, const VeskValueView& value) {
  switch (value.kind) {
    case VeskValueBoolean:
      out += value.as.boolean ? "true" : "false";
      return;
    case VeskValueSigned:
      out += std::to_string(value.as.signedInteger);
      return;
    case VeskValueUnsigned:
      out += std::to_string(value.as.unsignedInteger);
      return;
    case VeskValueDouble:
      return appendNumber(out, value.as.real);
    case VeskValueDate:
      return appendNumber(out, value.as.secondsSince1970);
    case VeskValueText:
      return appendText(out, value.as.text);
    case VeskValueList:
      return append(out, value.as.list);
    case VeskValueDictionary:
      return append(out, value.as.dictionary);
    default:  // bytes, the null marker, and kinds of later versions
      out += "null";
  }
}

void append(std::string& out, const VeskListView& list) {
  out += '[';
  for (size_t i = 0; i < list.count; ++i) {
    if (i > 0) out += ',';
    append(out, list.values[i]);
  }
  out += ']';
}

void append(std::string& out, const VeskDictionaryView& dictionary) {
  out += '{';
  for (size_t i = 0; i < dictionary.count; ++i) {
    if (i > 0) out += ',';
    appendText(out, dictionary.entries[i].key);
    out += ':';
    append(out, dictionary.entries[i].value);
  }
  out += '}';
}

void sendMessage(VeskWrenAdaptor* adaptor, uint16_t method, uint16_t respCode,
                 const VeskDictionaryView* dict) {
  std::string line =
      "{\"method\":" + std::to_string(method) + ",\"respCode\":" + std::to_string(respCode) + ",\"dict\":";
  append(line, *dict);
  line += "}\n";
  // A single write, so that lines of several sessions do not mix.
  const int file = reinterpret_cast<JSONLines*>(adaptor)->file;
  [[maybe_unused]] const ssize_t written = ::write(file, line.data(), line.size());
}

void release(VeskWrenAdaptor* adaptor) {
  std::unique_ptr<JSONLines> owned(reinterpret_cast<JSONLines*>(adaptor));
  ::close(owned->file);
}

const VeskWrenOperation kOperations[] = {
    {VESK_WREN_SEND_MESSAGE, reinterpret_cast<VeskWrenFunction>(&sendMessage)}, {nullptr, nullptr}};

}  // namespace

VeskWrenAdaptor* WrenAdaptor(const VeskWrenHost* host) {
  const std::string path = std::string(host->stateDirectory) + "/wren.jsonl";
  const int file = ::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0640);
  if (file < 0) {
    host->log(3, ("can't open " + path).c_str());
    return nullptr;
  }
  return &(new JSONLines{{VESK_WREN_ADAPTOR_VERSION, "JSON lines", kOperations, &release}, file})->base;
}
