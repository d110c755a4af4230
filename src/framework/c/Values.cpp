#include <cstring>
#include <memory>
#include <string>

#include "framework/c/Boundary.h"
#include "framework/c/values.h"
#include "platform/JSON.h"

using tallyd::c::ArgumentError;
using tallyd::c::object;
using tallyd::c::required;
using tallyd::c::status;
using tallyd::platform::Array;
using tallyd::platform::Data;
using tallyd::platform::Date;
using tallyd::platform::Dictionary;
using tallyd::platform::Value;

namespace {

thread_local std::string lastError;

tally_value* made(Value value) { return new tally_value{std::move(value)}; }

Value fromJSON(const char* text) {
  auto read = tallyd::platform::valueFromJSON(&required(text, "the JSON text"));
  if (!read.value) throw ArgumentError("not JSON: " + read.error);
  return *std::move(read.value);
}

Value dataValue(const void* bytes, std::size_t length) {
  if (length == 0) return Data();
  return Data(
      std::string(static_cast<const char*>(&required(static_cast<const char*>(bytes), "the data")), length));
}

void put(tally_value* dictionary, const char* key, Value element) {
  auto& value = required(dictionary, "the dictionary").value;
  const std::string name = &required(key, "the key");
  if (!value.dictionary()) throw ArgumentError("not a dictionary");
  // Moved out and back, so that a change does not copy the entries.
  Dictionary entries = *value.dictionary();
  value = Value();
  entries.set(name, std::move(element));
  value = Value(std::move(entries));
}

template <class Make>
tally_status set(tally_value* dictionary, const char* key, Make&& make) {
  return status([&] {
    put(dictionary, key, make());
    return tally_status{TALLY_OK};
  });
}

}  // namespace

void tallyd::c::setLastError(const char* reason) noexcept {
  try {
    lastError = reason;
  } catch (...) {
    lastError.clear();
  }
}

const char* tally_last_error(void) { return lastError.c_str(); }

void tally_value_free(tally_value* value) { delete value; }

tally_value* tally_value_from_json(const char* text) {
  return object([&] { return made(fromJSON(text)); });
}

tally_value* tally_value_new_null(void) {
  return object([] { return made(Value()); });
}

tally_value* tally_value_new_boolean(int value) {
  return object([&] { return made(value != 0); });
}

tally_value* tally_value_new_integer(int64_t value) {
  return object([&] { return made(value); });
}

tally_value* tally_value_new_unsigned(uint64_t value) {
  return object([&] { return made(value); });
}

tally_value* tally_value_new_real(double value) {
  return object([&] { return made(value); });
}

tally_value* tally_value_new_text(const char* text) {
  return object([&] { return made(std::string(&required(text, "the text"))); });
}

tally_value* tally_value_new_date(double seconds) {
  return object([&] { return made(Date{seconds}); });
}

tally_value* tally_value_new_data(const void* bytes, size_t length) {
  return object([&] { return made(dataValue(bytes, length)); });
}

tally_value* tally_value_new_array(void) {
  return object([] { return made(Array()); });
}

tally_value* tally_value_new_dictionary(void) {
  return object([] { return made(Dictionary()); });
}

tally_status tally_array_append(tally_value* array, tally_value* element) {
  if (array == element && array) {
    tallyd::c::setLastError("a value cannot hold itself");
    return TALLY_ERROR_ARGUMENT;
  }
  const std::unique_ptr<tally_value> taken(element);
  return status([&] {
    auto& value = required(array, "the array").value;
    required(element, "the element");
    if (!value.array()) throw ArgumentError("not an array");
    Array elements = *value.array();
    value = Value();
    elements.append(std::move(element->value));
    value = Value(std::move(elements));
    return tally_status{TALLY_OK};
  });
}

tally_status tally_dictionary_set(tally_value* dictionary, const char* key, tally_value* element) {
  if (dictionary == element && dictionary) {
    tallyd::c::setLastError("a value cannot hold itself");
    return TALLY_ERROR_ARGUMENT;
  }
  const std::unique_ptr<tally_value> taken(element);
  return set(dictionary, key, [&] { return std::move(required(element, "the element").value); });
}

tally_status tally_dictionary_set_boolean(tally_value* dictionary, const char* key, int value) {
  return set(dictionary, key, [&] { return Value(value != 0); });
}

tally_status tally_dictionary_set_integer(tally_value* dictionary, const char* key, int64_t value) {
  return set(dictionary, key, [&] { return Value(value); });
}

tally_status tally_dictionary_set_real(tally_value* dictionary, const char* key, double value) {
  return set(dictionary, key, [&] { return Value(value); });
}

tally_status tally_dictionary_set_text(tally_value* dictionary, const char* key, const char* text) {
  return set(dictionary, key, [&] { return Value(std::string(&required(text, "the text"))); });
}

tally_status tally_dictionary_set_date(tally_value* dictionary, const char* key, double seconds) {
  return set(dictionary, key, [&] { return Value(Date{seconds}); });
}

tally_status tally_dictionary_set_data(tally_value* dictionary, const char* key, const void* bytes,
                                       size_t length) {
  return set(dictionary, key, [&] { return dataValue(bytes, length); });
}

tally_status tally_dictionary_set_json(tally_value* dictionary, const char* key, const char* text) {
  return set(dictionary, key, [&] { return fromJSON(text); });
}

char* tally_value_description(const tally_value* value) {
  return object([&] {
    const std::string text = required(value, "the value").value.description();
    auto* copy = new char[text.size() + 1];
    std::memcpy(copy, text.c_str(), text.size() + 1);
    return copy;
  });
}

void tally_text_free(char* text) { delete[] text; }
