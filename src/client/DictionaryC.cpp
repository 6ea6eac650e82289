// The C ABI over DictionaryWriter: arguments checked, nothing thrown across.

#include <cstring>

#include "client/DictionaryHandle.h"

using halyard::Date;
using halyard::Value;
using halyard::client::DictionaryWriter;

namespace {

template <class Set> halyard_result change(halyard_dictionary* dictionary, Set set) {
    return dictionary != nullptr ? set(dictionary->writer) : HALYARD_INVALID;
}

halyard_result setNumber(halyard_dictionary* dictionary, const char* key, const Value& value) {
    return change(dictionary,
                  [&](DictionaryWriter& writer) { return writer.setNumber(key, value); });
}

} // namespace

extern "C" {

halyard_dictionary* halyard_dictionary_create(size_t capacity) {
    try {
        return new halyard_dictionary{DictionaryWriter(capacity)};
    } catch (...) {
        return nullptr;
    }
}

void halyard_dictionary_destroy(halyard_dictionary* dictionary) {
    delete dictionary;
}

void halyard_dictionary_clear(halyard_dictionary* dictionary) {
    if (dictionary != nullptr) {
        dictionary->writer.clear();
    }
}

halyard_result halyard_dictionary_set_string(halyard_dictionary* dictionary, const char* key,
                                             const char* value) {
    return halyard_dictionary_set_text(dictionary, key, value,
                                       value != nullptr ? std::strlen(value) : 1);
}

halyard_result halyard_dictionary_set_text(halyard_dictionary* dictionary, const char* key,
                                           const char* value, size_t length) {
    return change(dictionary, [&](DictionaryWriter& writer) {
        if (value == nullptr && length != 0) {
            return writer.fail(HALYARD_INVALID);
        }
        return writer.setText(key, {value, length});
    });
}

halyard_result halyard_dictionary_set_int(halyard_dictionary* dictionary, const char* key,
                                          int64_t value) {
    return setNumber(dictionary, key, value);
}

halyard_result halyard_dictionary_set_uint(halyard_dictionary* dictionary, const char* key,
                                           uint64_t value) {
    return setNumber(dictionary, key, value);
}

halyard_result halyard_dictionary_set_double(halyard_dictionary* dictionary, const char* key,
                                             double value) {
    return setNumber(dictionary, key, value);
}

halyard_result halyard_dictionary_set_float(halyard_dictionary* dictionary, const char* key,
                                            float value) {
    return setNumber(dictionary, key, value);
}

halyard_result halyard_dictionary_set_bool(halyard_dictionary* dictionary, const char* key,
                                           bool value) {
    return setNumber(dictionary, key, value);
}

halyard_result halyard_dictionary_set_date(halyard_dictionary* dictionary, const char* key,
                                           int64_t seconds, uint32_t nanoseconds) {
    return change(dictionary, [&](DictionaryWriter& writer) {
        return nanoseconds < 1'000'000'000 ? writer.setNumber(key, Date{seconds, nanoseconds})
                                           : writer.fail(HALYARD_INVALID);
    });
}

halyard_result halyard_dictionary_begin_dictionary(halyard_dictionary* dictionary,
                                                   const char* key) {
    return change(dictionary,
                  [&](DictionaryWriter& writer) { return writer.beginContainer(key, false); });
}

halyard_result halyard_dictionary_begin_list(halyard_dictionary* dictionary, const char* key) {
    return change(dictionary,
                  [&](DictionaryWriter& writer) { return writer.beginContainer(key, true); });
}

halyard_result halyard_dictionary_end(halyard_dictionary* dictionary) {
    return change(dictionary, [](DictionaryWriter& writer) { return writer.endContainer(); });
}

} // extern "C"
