#include "host/core/Crypto.h"

#include <cstdint>
#include <nettle/base64.h>
#include <nettle/hmac.h>
#include <nettle/memops.h>
#include <nettle/sha2.h>
#include <sys/random.h>

namespace norvhost {
namespace {

const uint8_t *bytesOf(std::string_view text)
{
    return reinterpret_cast<const uint8_t *>(text.data());
}

uint8_t *bytesOf(std::string &text)
{
    return reinterpret_cast<uint8_t *>(text.data());
}

} // namespace

std::string randomBytes(size_t count)
{
    std::string bytes(count, '\0');
    for (size_t done = 0; done < count;) {
        const ssize_t got = getrandom(bytes.data() + done, count - done, 0);
        if (got > 0) // it fails only when a signal interrupts it
            done += static_cast<size_t>(got);
    }
    return bytes;
}

std::string sha256(std::string_view data)
{
    sha256_ctx context;
    sha256_init(&context);
    sha256_update(&context, data.size(), bytesOf(data));
    std::string digest(SHA256_DIGEST_SIZE, '\0');
    sha256_digest(&context, digest.size(), bytesOf(digest));
    return digest;
}

std::string hmacSha256(std::string_view key, std::string_view data)
{
    hmac_sha256_ctx context;
    hmac_sha256_set_key(&context, key.size(), bytesOf(key));
    hmac_sha256_update(&context, data.size(), bytesOf(data));
    std::string digest(SHA256_DIGEST_SIZE, '\0');
    hmac_sha256_digest(&context, digest.size(), bytesOf(digest));
    return digest;
}

bool sameBytes(std::string_view left, std::string_view right)
{
    return left.size() == right.size() && memeql_sec(left.data(), right.data(), left.size());
}

std::string toHex(std::string_view bytes)
{
    constexpr char digits[] = "0123456789abcdef";
    std::string text;
    text.reserve(bytes.size() * 2);
    for (const char byte : bytes) {
        text += digits[static_cast<uint8_t>(byte) >> 4];
        text += digits[static_cast<uint8_t>(byte) & 15];
    }
    return text;
}

std::string fromBase64(std::string_view text)
{
    base64_decode_ctx context;
    base64_decode_init(&context);
    std::string bytes(BASE64_DECODE_LENGTH(text.size()), '\0');
    size_t size = bytes.size();
    if (!base64_decode_update(&context, &size, bytesOf(bytes), text.size(), text.data()) ||
        !base64_decode_final(&context))
        return "";
    bytes.resize(size);
    return bytes;
}

std::string toBase64(std::string_view bytes)
{
    std::string text(BASE64_ENCODE_RAW_LENGTH(bytes.size()), '\0');
    base64_encode_raw(text.data(), bytes.size(), bytesOf(bytes));
    return text;
}

std::string pinOfKey(std::string_view der)
{
    return std::string(pin_prefix) + toBase64(sha256(der));
}

std::string toBase64Url(std::string_view bytes)
{
    base64_encode_ctx context;
    base64url_encode_init(&context);
    std::string text(BASE64_ENCODE_LENGTH(bytes.size()), '\0');
    text.resize(base64_encode_update(&context, text.data(), bytes.size(), bytesOf(bytes)));
    char rest[BASE64_ENCODE_FINAL_LENGTH];
    text.append(rest, base64_encode_final(&context, rest));
    text.erase(text.find_last_not_of('=') + 1);
    return text;
}

} // namespace norvhost
