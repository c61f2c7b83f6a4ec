// The results and dictionaries of the C API.
#include <VeskReporting/values/ValueViews.h>
#include <VeskReporting/veskreporting.h>

#include <exception>
#include <memory>
#include <new>

#include "client/ReportingAnswer.h"

using namespace vesk;

const char* vesk_status_text(vesk_status status) {
  const bool isKnown = status >= VESK_DONE && status <= VESK_TOO_MANY_CONNECTIONS;
  return isKnown ? describe(static_cast<ReportingStatus>(status)) : "unknown";
}

vesk_status vesk_result_status(const vesk_result* result) {
  return result ? static_cast<vesk_status>(result->status) : VESK_INVALID_ARGUMENT;
}

const char* vesk_result_detail(const vesk_result* result) { return result ? result->detail.c_str() : ""; }

const char* vesk_result_text(const vesk_result* result) {
  return result && result->text ? result->text->c_str() : nullptr;
}

int vesk_result_accepted(const vesk_result* result) { return result && result->accepted ? 1 : 0; }

size_t vesk_result_backend_count(const vesk_result* result) { return result ? result->backends.size() : 0; }

const char* vesk_result_backend(const vesk_result* result, size_t index) {
  return index < vesk_result_backend_count(result) ? result->backends[index].c_str() : nullptr;
}

void vesk_result_free(vesk_result* result) { delete result; }

struct vesk_dictionary {
  MutableDictionary entries;
  // Built on demand.
  mutable Dictionary shared;
  mutable std::unique_ptr<ValueViews> views;
};

vesk_dictionary* vesk_dictionary_new() { return new (std::nothrow) vesk_dictionary; }

void vesk_dictionary_free(vesk_dictionary* dictionary) { delete dictionary; }

namespace {

/// `make` returns the value, or nullopt if it can't be held.
template <class Make>
vesk_status set(vesk_dictionary* dictionary, const char* key, const Make& make) noexcept {
  if (!dictionary || !key) return VESK_INVALID_ARGUMENT;
  try {
    std::optional<Value> value = make();
    if (!value) return VESK_INVALID_ARGUMENT;
    dictionary->views.reset();
    dictionary->entries.set(key, *std::move(value));
    return VESK_DONE;
  } catch (const std::exception&) {
    return VESK_OUT_OF_RESOURCES;
  }
}

}  // namespace

vesk_status vesk_dictionary_set(vesk_dictionary* dictionary, const char* key, const VeskValueView* value) {
  return set(dictionary, key, [&] { return value ? detail::copyNested(*value, 1) : std::nullopt; });
}

vesk_status vesk_dictionary_set_text(vesk_dictionary* dictionary, const char* key, const char* text) {
  return set(dictionary, key, [&] { return text ? std::optional<Value>(text) : std::nullopt; });
}

vesk_status vesk_dictionary_set_integer(vesk_dictionary* dictionary, const char* key, int64_t number) {
  return set(dictionary, key, [&] { return std::optional<Value>(number); });
}

vesk_status vesk_dictionary_set_double(vesk_dictionary* dictionary, const char* key, double number) {
  return set(dictionary, key, [&] { return std::optional<Value>(number); });
}

vesk_status vesk_dictionary_set_boolean(vesk_dictionary* dictionary, const char* key, int boolean) {
  return set(dictionary, key, [&] { return std::optional<Value>(boolean != 0); });
}

vesk_status vesk_dictionary_set_dictionary(vesk_dictionary* dictionary, const char* key,
                                           const vesk_dictionary* value) {
  return set(dictionary, key, [&] {
    return value ? std::optional<Value>(MutableDictionary(value->entries).share()) : std::nullopt;
  });
}

const VeskDictionaryView* vesk_dictionary_view(const vesk_dictionary* dictionary) {
  if (!dictionary) return nullptr;
  try {
    if (!dictionary->views) {
      dictionary->shared = MutableDictionary(dictionary->entries).share();
      dictionary->views = std::make_unique<ValueViews>(dictionary->shared);
    }
    return &dictionary->views->dictionary();
  } catch (const std::exception&) {
    return nullptr;
  }
}
