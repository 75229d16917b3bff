#include "host/target/portal/Pdu.h"

#include <algorithm>
#include <cstring>

namespace norvhost::portal {

uint32_t Pdu::word(size_t offset) const
{
    const uint8_t *p = header + offset;
    return static_cast<uint32_t>(p[0]) << 24 | static_cast<uint32_t>(p[1]) << 16 | static_cast<uint32_t>(p[2]) << 8 |
           p[3];
}

uint16_t Pdu::half(size_t offset) const
{
    return static_cast<uint16_t>(header[offset] << 8 | header[offset + 1]);
}

bool PduReader::feed(std::string_view &bytes)
{
    while (!bytes.empty() && !complete()) {
        const size_t count = std::min(bytes.size(), needed - filled);
        memcpy(buffer + filled, bytes.data(), count);
        filled += count;
        bytes.remove_prefix(count);
        if (filled < needed || sized)
            continue;
        // No request that we serve has additional header segments.
        data_size = static_cast<size_t>(buffer[5]) << 16 | static_cast<size_t>(buffer[6]) << 8 | buffer[7];
        if (buffer[4] != 0 || data_size > data_max)
            return false;
        needed = header_size + (data_size + 3) / 4 * 4;
        sized = true;
    }
    return true;
}

Pdu PduReader::pdu() const
{
    return {buffer, {reinterpret_cast<const char *>(buffer) + header_size, data_size}};
}

void PduReader::drop()
{
    filled = 0;
    needed = header_size;
    data_size = 0;
    sized = false;
}

PduWriter::PduWriter(Opcode opcode, uint8_t flags)
{
    header[0] = opcode;
    header[1] = flags;
}

PduWriter &PduWriter::copy(size_t offset, const uint8_t *bytes, size_t size)
{
    memcpy(header + offset, bytes, size);
    return *this;
}

PduWriter &PduWriter::byte(size_t offset, uint8_t value)
{
    header[offset] = value;
    return *this;
}

PduWriter &PduWriter::half(size_t offset, uint16_t value)
{
    header[offset] = static_cast<uint8_t>(value >> 8);
    header[offset + 1] = static_cast<uint8_t>(value);
    return *this;
}

PduWriter &PduWriter::word(size_t offset, uint32_t value)
{
    return half(offset, static_cast<uint16_t>(value >> 16)).half(offset + 2, static_cast<uint16_t>(value));
}

void PduWriter::write(std::string &output, std::string_view data)
{
    byte(5, static_cast<uint8_t>(data.size() >> 16)).half(6, static_cast<uint16_t>(data.size()));
    output.append(reinterpret_cast<const char *>(header), header_size);
    output.append(data);
    output.append((4 - data.size() % 4) % 4, '\0');
}

bool parseText(std::string_view text, std::vector<TextKey> &keys)
{
    keys.clear();
    while (!text.empty()) {
        const size_t end = std::min(text.find('\0'), text.size());
        const std::string_view entry = text.substr(0, end);
        text.remove_prefix(std::min(end + 1, text.size()));
        if (entry.empty()) // some initiators pad with NULs inside of the data
            continue;
        const size_t equals = entry.find('=');
        if (equals == 0 || equals == entry.npos || keys.size() == text_keys_max)
            return false;
        if (findKey(keys, entry.substr(0, equals)))
            return false;
        keys.push_back({entry.substr(0, equals), entry.substr(equals + 1)});
    }
    return true;
}

const std::string_view *findKey(const std::vector<TextKey> &keys, std::string_view key)
{
    for (const TextKey &entry : keys)
        if (entry.key == key)
            return &entry.value;
    return nullptr;
}

void addKey(std::string &text, std::string_view key, std::string_view value)
{
    text.append(key).append(1, '=').append(value).append(1, '\0');
}

bool listHolds(std::string_view list, std::string_view value)
{
    for (;;) {
        const size_t comma = std::min(list.find(','), list.size());
        if (list.substr(0, comma) == value)
            return true;
        if (comma == list.size())
            return false;
        list.remove_prefix(comma + 1);
    }
}

} // namespace norvhost::portal
