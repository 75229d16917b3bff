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

/// Compares in a time that tells nothing of where two secrets differ.
bool sameBytes(std::string_view left, std::string_view right);

/// Two lower-case digits a byte.
std::string toHex(std::string_view bytes);

/// RFC 4648, with padding.
std::string toBase64(std::string_view bytes);

/// The SHA-256 of a public key (DER, SubjectPublicKeyInfo) as peers pin it: the prefix and base64.
std::string pinOfKey(std::string_view der);
inline constexpr std::string_view pin_prefix = "sha256//";

/// What a text in base64 stands for, line breaks skipped; empty for what is none.
std::string fromBase64(std::string_view text);

/// RFC 4648's alphabet for URLs and file names, without padding.
std::string toBase64Url(std::string_view bytes);

} // namespace norvhost
