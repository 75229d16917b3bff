#include "host/services/Password.h"

#include "host/core/Crypto.h"
#include "host/core/LastError.h"
#include "platform/error.h"

#include <algorithm>
#include <crypt.h>
#include <cstdlib>
#include <cstring>
#include <liboath/oath.h>
#include <memory>
#include <unistd.h>

namespace norvhost {
namespace {

constexpr size_t shortest_password = 8;

constexpr size_t otp_secret_bytes = 20; // RFC 4226 recommends 160 bits
constexpr size_t otp_digits = 6;
constexpr unsigned otp_step_seconds = 30;
constexpr size_t otp_window = 1;

struct Free {
    void operator()(char *text) const { free(text); }
};
using CText = std::unique_ptr<char, Free>;

/// Empty when the setting is none that crypt(5) knows.
std::string cryptWith(const std::string &password, const std::string &setting)
{
    const auto data = std::make_unique<crypt_data>();
    const char *hash = crypt_r(password.c_str(), setting.c_str(), data.get());
    std::string result(hash && *hash != '*' ? hash : "");
    explicit_bzero(data.get(), sizeof *data);
    return result;
}

std::string newSetting()
{
    char setting[CRYPT_GENSALT_OUTPUT_SIZE];
    return crypt_gensalt_rn("$y$", 0, nullptr, 0, setting, sizeof setting) ? setting : "";
}

/// This machine's name, of characters that need no encoding.
std::string machineName()
{
    char name[256] = {};
    gethostname(name, sizeof name - 1);
    std::string text(name);
    const auto plain = [](unsigned char c) { return isalnum(c) || c == '-' || c == '.'; };
    text.erase(std::find_if_not(text.begin(), text.end(), plain), text.end());
    return text;
}

} // namespace

int checkPassword(const std::string &password)
{
    const auto control = [](unsigned char c) { return c < ' ' || c == 0x7f; };
    if (std::any_of(password.begin(), password.end(), control))
        return fail(NORV_ERR_PASSWORD, "the password has control characters");
    if (password.size() < shortest_password || password.size() >= CRYPT_MAX_PASSPHRASE_SIZE)
        return fail(NORV_ERR_PASSWORD, "the password has %zu bytes; it needs %zu to %d", password.size(),
                    shortest_password, CRYPT_MAX_PASSPHRASE_SIZE - 1);
    return 0;
}

std::string hashPassword(const std::string &password)
{
    return cryptWith(password, newSetting());
}

bool passwordFits(const std::string &password, const std::string &hash)
{
    const std::string computed = cryptWith(password, hash.empty() ? newSetting() : hash);
    return !hash.empty() && sameBytes(computed, hash);
}

std::string newOtpSecret()
{
    const std::string secret = randomBytes(otp_secret_bytes);
    char *text = nullptr;
    size_t length = 0;
    if (oath_init() != OATH_OK || oath_base32_encode(secret.data(), secret.size(), &text, &length) != OATH_OK)
        return "";
    return std::string(CText(text).get(), length);
}

std::string otpUri(const std::string &account, const std::string &secret)
{
    const std::string issuer = "iSCSI%20" + machineName();
    return "otpauth://totp/" + issuer + ":" + account + "?secret=" + secret + "&issuer=" + issuer +
           "&algorithm=SHA1&digits=6&period=30";
}

int64_t otpStep(const std::string &code, const std::string &secret, int64_t now)
{
    const auto digit = [](char c) { return c >= '0' && c <= '9'; };
    if (code.size() != otp_digits || !std::all_of(code.begin(), code.end(), digit))
        return -1;
    char *decoded = nullptr;
    size_t length = 0;
    if (oath_init() != OATH_OK || oath_base32_decode(secret.data(), secret.size(), &decoded, &length) != OATH_OK)
        return -1;
    const CText key(decoded);
    int distance = 0;
    if (oath_totp_validate2(key.get(), length, now, otp_step_seconds, 0, otp_window, &distance, code.c_str()) < 0)
        return -1;
    return now / otp_step_seconds + distance;
}

} // namespace norvhost
