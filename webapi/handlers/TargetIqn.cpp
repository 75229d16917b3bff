#include "webapi/handlers/TargetIqn.h"

#include <string_view>

namespace webapi {
namespace {

/// The text in an IQN's alphabet, without '-' and '.' at either end.
std::string iqnText(std::string_view text)
{
    std::string out;
    for (char c : text) {
        if (c >= 'A' && c <= 'Z')
            c = static_cast<char>(c - 'A' + 'a');
        if ((c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '.')
            out += c;
        else if (!out.empty() && out.back() != '-')
            out += '-';
    }
    const size_t first = out.find_first_not_of("-.");
    if (first == std::string::npos)
        return "";
    return out.substr(first, out.find_last_not_of("-.") - first + 1);
}

/// "box.example.com" to "com.example.box".
std::string reversed(std::string_view host)
{
    std::string out;
    while (!host.empty()) {
        const size_t dot = host.rfind('.');
        const std::string label = iqnText(host.substr(dot == std::string_view::npos ? 0 : dot + 1));
        if (!label.empty())
            out += (out.empty() ? "" : ".") + label;
        host = host.substr(0, dot == std::string_view::npos ? 0 : dot);
    }
    return out.empty() ? "localhost" : out;
}

} // namespace

std::string targetIqn(const std::string &host, const std::string &name)
{
    constexpr size_t IQN_MAX_BYTES = 223; // RFC 7143, 4.2.7.1
    const std::string suffix = iqnText(name);
    const std::string iqn = "iqn.2001-01." + reversed(host) + ":" + suffix;
    return suffix.empty() || iqn.size() > IQN_MAX_BYTES ? "" : iqn;
}

} // namespace webapi
