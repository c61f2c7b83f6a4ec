#include "backends/wren/WrenPayload.h"

#include <string_view>

namespace vesk {

namespace {

VeskTextView textView(std::string_view text) { return {text.data(), text.size()}; }

}  // namespace

VeskDictionaryView WrenPayload::viewOf(const Dictionary& dictionary) {
  auto& entries = _entries.emplace_back();
  entries.reserve(dictionary.size());
  for (const DictionaryEntry& entry : dictionary) {
    entries.push_back({textView(entry.key.view()), viewOf(entry.value)});
  }
  return {entries.data(), entries.size()};
}

VeskListView WrenPayload::viewOf(const List& list) {
  auto& values = _values.emplace_back();
  values.reserve(list.size());
  for (const Value& value : list) values.push_back(viewOf(value));
  return {values.data(), values.size()};
}

VeskValueView WrenPayload::viewOf(const Value& value) {
  VeskValueView view{};
  switch (value.kind()) {
    case Value::Kind::None:
      view.kind = VeskValueNone;
      break;
    case Value::Kind::Boolean:
      view.kind = VeskValueBoolean;
      view.as.boolean = *value.boolean() ? 1 : 0;
      break;
    case Value::Kind::Signed:
      view.kind = VeskValueSigned;
      view.as.signedInteger = *value.signedInteger();
      break;
    case Value::Kind::Unsigned:
      view.kind = VeskValueUnsigned;
      view.as.unsignedInteger = *value.unsignedInteger();
      break;
    case Value::Kind::Double:
      view.kind = VeskValueDouble;
      view.as.real = *value.real();
      break;
    case Value::Kind::Text:
      view.kind = VeskValueText;
      view.as.text = textView(value.text()->view());
      break;
    case Value::Kind::Bytes:
      view.kind = VeskValueBytes;
      view.as.bytes = textView(value.bytes()->view());
      break;
    case Value::Kind::Date:
      view.kind = VeskValueDate;
      view.as.secondsSince1970 = value.date()->secondsSince1970;
      break;
    case Value::Kind::List:
      view.kind = VeskValueList;
      view.as.list = viewOf(*value.list());
      break;
    case Value::Kind::Dictionary:
      view.kind = VeskValueDictionary;
      view.as.dictionary = viewOf(*value.dictionary());
      break;
  }
  return view;
}

}  // namespace vesk
