/// Random secrets, digests, and texts of bytes.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace norvhost {

/// So many bytes of the kernel's random numbers.
std::string randomBytes(size_t count);

/// 32 bytes.
std::string sha256(std::string_view data);

/// HMAC-SHA256 (RFC 2104), 32 bytes.
std::string hmacSha256(std::string_view key, std::string_view data);

/// Two lower-case digits a byte.
std::string toHex(std::string_view bytes);

/// RFC 4648's alphabet for URLs and file names, without padding.
std::string toBase64Url(std::string_view bytes);

} // namespace norvhost
