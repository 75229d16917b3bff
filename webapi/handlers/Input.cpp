#include "webapi/handlers/Input.h"

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <algorithm>
#include <cctype>
#include <string_view>

namespace webapi {
namespace {

using ISCSI::ERR_INVALID_INPUT;

/// Length of the UTF-8 sequence at the start of `text`, 0 when there is none. Overlong forms,
/// surrogates and what lies above U+10FFFF are none.
size_t sequenceLength(std::string_view text)
{
    const auto byte = [&](size_t i) { return i < text.size() ? static_cast<unsigned char>(text[i]) : 0u; };
    const unsigned lead = byte(0);
    if (lead < 0x80)
        return 1;
    const size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
    if (lead < 0xC2 || lead > 0xF4)
        return 0;
    for (size_t i = 1; i < length; ++i) {
        if ((byte(i) & 0xC0) != 0x80)
            return 0;
    }
    const unsigned second = byte(1);
    const bool bad = (lead == 0xE0 && second < 0xA0) || (lead == 0xED && second >= 0xA0) ||
                     (lead == 0xF0 && second < 0x90) || (lead == 0xF4 && second >= 0x90);
    return bad ? 0 : length;
}

bool isChoice(std::string_view choices, std::string_view word)
{
    while (true) {
        const size_t end = choices.find('|');
        if (choices.substr(0, end) == word)
            return true;
        if (end == std::string_view::npos)
            return false;
        choices.remove_prefix(end + 1);
    }
}

std::string limits(const Field &field, const char *unit)
{
    return "must have " + std::to_string(field.min) + " to " + std::to_string(field.max) + unit;
}

class Checker {
public:
    explicit Checker(std::string &reason) : reason(reason) {}

    int checkObject(Fields fields, const Json::Value &object, const std::string &path)
    {
        if (!object.isObject())
            return refuse(ERR_INVALID_INPUT, path.empty() ? "the input" : path, "must be an object");
        for (const std::string &name : object.getMemberNames()) {
            const bool known =
                std::any_of(fields.begin(), fields.end(), [&](const Field &f) { return f.name == name; });
            constexpr size_t SHOWN = 64;
            if (!known)
                return refuse(ERR_INVALID_INPUT, join(path, name.substr(0, SHOWN)), "no such field");
        }
        for (const Field &field : fields) {
            const std::string name = join(path, field.name);
            if (const Json::Value *value =
                    object.find(field.name, field.name + std::char_traits<char>::length(field.name))) {
                if (int err = checkValue(field, *value, name))
                    return err;
            } else if (field.required) {
                return refuse(ERR_INVALID_INPUT, name, "is missing");
            }
        }
        return 0;
    }

private:
    std::string &reason;

    static std::string join(const std::string &path, const std::string &name)
    {
        return path.empty() ? name : path + "." + name;
    }

    int refuse(int code, const std::string &name, const std::string &what)
    {
        reason = name + ": " + what;
        return code;
    }

    int checkValue(const Field &field, const Json::Value &value, const std::string &name)
    {
        switch (field.type) {
        case Type::Text:
            return checkText(field, value, name);
        case Type::Unsigned:
            // A number with a fraction or an exponent is another type here, also when it is whole.
            if (value.type() != Json::intValue && value.type() != Json::uintValue)
                return refuse(ERR_INVALID_INPUT, name, "must be a whole number");
            if (!value.isUInt64() || value.asUInt64() < field.min || value.asUInt64() > field.max)
                return refuse(field.code, name,
                              "must be from " + std::to_string(field.min) + " to " + std::to_string(field.max));
            return 0;
        case Type::Boolean:
            return value.isBool() ? 0 : refuse(ERR_INVALID_INPUT, name, "must be true or false");
        case Type::List:
            return checkList(field, value, name);
        case Type::Object:
            return checkObject(field.items, value, name);
        }
        return refuse(ERR_INVALID_INPUT, name, "is of no known type");
    }

    int checkText(const Field &field, const Json::Value &value, const std::string &name)
    {
        if (!value.isString())
            return refuse(ERR_INVALID_INPUT, name, "must be a text");
        const std::string text = value.asString();
        if (text.size() < field.min || text.size() > field.max)
            return refuse(field.code, name, limits(field, " bytes"));
        if (text.find('\0') != std::string::npos)
            return refuse(field.code, name, "must not hold a NUL");
        if (!isUtf8(text))
            return refuse(field.code, name, "must be UTF-8");
        if (field.choices && !isChoice(field.choices, text)) {
            std::string words(field.choices);
            for (size_t at; (at = words.find('|')) != std::string::npos;)
                words.replace(at, 1, ", ");
            return refuse(field.code, name, "must be one of " + words);
        }
        return 0;
    }

    int checkList(const Field &field, const Json::Value &value, const std::string &name)
    {
        if (!value.isArray())
            return refuse(ERR_INVALID_INPUT, name, "must be a list");
        if (value.size() < field.min || value.size() > field.max)
            return refuse(field.code, name, limits(field, " elements"));
        for (Json::ArrayIndex i = 0; i < value.size(); ++i) {
            if (int err = checkValue(*field.items.begin(), value[i], name + "[" + std::to_string(i) + "]"))
                return err;
        }
        return 0;
    }
};

} // namespace

int checkInput(Fields fields, const Json::Value &input, std::string &reason)
{
    return Checker(reason).checkObject(fields, input, "");
}

bool isUtf8(std::string_view text)
{
    while (!text.empty()) {
        const size_t length = sequenceLength(text);
        if (length == 0)
            return false;
        text.remove_prefix(length);
    }
    return true;
}

bool isUuid(const std::string &text)
{
    static const std::string form = "xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx";
    return std::equal(text.begin(), text.end(), form.begin(), form.end(),
                      [](unsigned char c, char wanted) { return wanted == 'x' ? std::isxdigit(c) != 0 : c == wanted; });
}

} // namespace webapi
