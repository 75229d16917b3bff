/// iSCSI protocol data units as the portal reads and writes them (RFC 7143, 11).
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace norvhost::portal {

constexpr size_t header_size = 48;
constexpr size_t data_max = 8192; ///< MaxRecvDataSegmentLength before it is negotiated, and ours after
constexpr uint32_t reserved_tag = 0xffffffff;

enum Opcode : uint8_t {
    op_nop_out = 0x00,
    op_login = 0x03,
    op_text = 0x04,
    op_logout = 0x06,
    op_nop_in = 0x20,
    op_login_response = 0x23,
    op_text_response = 0x24,
    op_logout_response = 0x26,
    op_reject = 0x3f,
};

/// Status classes and details of a login response, one number (RFC 7143, 11.13.5).
enum LoginStatus : uint16_t {
    login_ok = 0x0000,
    login_moved = 0x0101,
    login_initiator_error = 0x0200,
    login_not_authenticated = 0x0201,
    login_not_found = 0x0203,
    login_unsupported_version = 0x0205,
    login_too_many_connections = 0x0206,
    login_missing_parameter = 0x0207,
    login_bad_session_type = 0x0209,
    login_no_session = 0x020a,
    login_service_unavailable = 0x0301,
    login_out_of_resources = 0x0302,
};

constexpr uint8_t final_bit = 0x80; ///< of text, "transit" of login
constexpr uint8_t continue_bit = 0x40;

/// A request; `data` is what follows the header, without padding.
struct Pdu {
    const uint8_t *header = nullptr;
    std::string_view data;

    uint8_t opcode() const { return header[0] & 0x3f; }
    bool immediate() const { return header[0] & 0x40; }
    uint8_t flags() const { return header[1]; }
    uint32_t word(size_t offset) const;
    uint16_t half(size_t offset) const;

    uint32_t taskTag() const { return word(16); }
    uint32_t transferTag() const { return word(20); }
    uint32_t commandNumber() const { return word(24); }
};

/// Cuts requests out of a stream of bytes. The buffer is of fixed size; what does not fit in is an error.
class PduReader {
public:
    /// Takes in bytes from the front of `bytes`, which it shortens, until a request is complete.
    /// False when the stream can hold no request that we serve; the reader is of no use then.
    bool feed(std::string_view &bytes);

    bool complete() const { return sized && filled == needed; }
    /// Valid until drop().
    Pdu pdu() const;
    void drop();

private:
    uint8_t buffer[header_size + data_max];
    size_t filled = 0;
    size_t needed = header_size;
    size_t data_size = 0;
    bool sized = false; ///< the header was read and `needed` counts the data
};

/// A response's header with its fields at the offsets of the standard.
class PduWriter {
public:
    PduWriter(Opcode opcode, uint8_t flags);
    PduWriter &copy(size_t offset, const uint8_t *bytes, size_t size);
    PduWriter &byte(size_t offset, uint8_t value);
    PduWriter &half(size_t offset, uint16_t value);
    PduWriter &word(size_t offset, uint32_t value);
    /// Appends header, data and padding.
    void write(std::string &output, std::string_view data = {});

private:
    uint8_t header[header_size] = {};
};

/// One "key=value" of a text.
struct TextKey {
    std::string_view key, value;
};

constexpr size_t text_keys_max = 64;

/// Splits "key=value\0key=value\0"; false for anything else, too many keys or a key given twice.
bool parseText(std::string_view text, std::vector<TextKey> &keys);

/// The value of a key, null when it is not there.
const std::string_view *findKey(const std::vector<TextKey> &keys, std::string_view key);

void addKey(std::string &text, std::string_view key, std::string_view value);

/// Whether a comma-separated list holds the value.
bool listHolds(std::string_view list, std::string_view value);

} // namespace norvhost::portal
