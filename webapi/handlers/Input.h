/// What a request may carry, and the one check of it.
#pragma once

#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace webapi {

struct Field;

/// Some fields; the array they lie in is static.
struct Fields {
    const Field *first = nullptr;
    size_t count = 0;

    constexpr Fields() = default;
    template <size_t size>
    constexpr Fields(const Field (&array)[size]) : first(array), count(size)
    {
    }
    const Field *begin() const { return first; }
    const Field *end() const;
};

enum class Type {
    Text,     ///< limits in bytes; UTF-8 without NUL
    Unsigned, ///< a whole number; limits of the number
    Boolean,
    List,   ///< limits of the number of elements, which `items` describes by one field
    Object, ///< `items` are its fields
};

/// One input field. A request holds every required field and none that is not described.
struct Field {
    const char *name;
    Type type;
    bool required;
    uint64_t min;
    uint64_t max;
    int code;                      ///< the library's error code of a value outside its limits
    const char *choices = nullptr; ///< Text: the allowed words, separated by '|'; null: any text
    Fields items = {};
};

inline const Field *Fields::end() const
{
    return first + count;
}

/// Checks an object against its fields. Returns 0, or an error code with `reason` naming the field
/// that is wrong; values are not repeated there, they can be secrets.
int checkInput(Fields fields, const Json::Value &input, std::string &reason);

bool isUtf8(std::string_view text);

/// Whether the text is of the form 8-4-4-4-12 hexadecimal digits.
bool isUuid(const std::string &text);

} // namespace webapi
