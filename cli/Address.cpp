#include "cli/Address.h"

#include <algorithm>

namespace cli {
namespace {

constexpr uint16_t DEFAULT_PORT = 5443;

std::optional<uint16_t> parsePort(const std::string &text)
{
    constexpr size_t MAX_DIGITS = 5;
    if (text.empty() || text.size() > MAX_DIGITS || text.find_first_not_of("0123456789") != std::string::npos)
        return std::nullopt;
    const unsigned long number = std::stoul(text);
    if (number == 0 || number > UINT16_MAX)
        return std::nullopt;
    return static_cast<uint16_t>(number);
}

} // namespace

std::optional<Address> parseAddress(const std::string &text)
{
    Address address{text, DEFAULT_PORT};
    std::string behind; // the host
    if (!text.empty() && text.front() == '[') {
        const size_t end = text.find(']');
        if (end == std::string::npos)
            return std::nullopt;
        address.host = text.substr(1, end - 1);
        behind = text.substr(end + 1);
    } else if (std::count(text.begin(), text.end(), ':') == 1) {
        const size_t colon = text.find(':');
        address.host = text.substr(0, colon);
        behind = text.substr(colon);
    }
    if (address.host.empty() || address.host.find_first_of("[]/@ ") != std::string::npos)
        return std::nullopt;
    if (behind.empty())
        return address;
    const auto port = behind.front() == ':' ? parsePort(behind.substr(1)) : std::nullopt;
    if (!port)
        return std::nullopt;
    address.port = *port;
    return address;
}

std::optional<Address> parseUrl(const std::string &text)
{
    const std::string scheme = "https://";
    if (text.compare(0, scheme.size(), scheme) != 0)
        return std::nullopt;
    std::string rest = text.substr(scheme.size());
    if (!rest.empty() && rest.back() == '/')
        rest.pop_back();
    return parseAddress(rest);
}

std::string addressText(const Address &address)
{
    const bool v6 = address.host.find(':') != std::string::npos;
    return (v6 ? "[" + address.host + "]" : address.host) + ":" + std::to_string(address.port);
}

} // namespace cli
