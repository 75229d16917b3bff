#include "host/peer/Pins.h"

#include "host/core/Crypto.h"
#include "host/core/LastError.h"
#include "host/peer/Address.h"
#include "host/peer/Libraries.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "platform/error.h"

#include <iscsihost/https.h>
#include <memory>

namespace norvhost {
namespace {

constexpr size_t digest_base64_size = 44;
constexpr const char *base64_alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

/// The public key as it stands in the certificate.
std::string publicKey(const LibCrypto &crypto, const X509 *certificate)
{
    X509_PUBKEY *const key = crypto.x509_get_x509_pubkey(certificate); // the certificate's
    const int size = crypto.i2d_x509_pubkey(key, nullptr);
    if (size <= 0)
        return {};
    std::string der(static_cast<size_t>(size), '\0');
    auto *out = reinterpret_cast<unsigned char *>(der.data());
    crypto.i2d_x509_pubkey(key, &out);
    return der;
}

} // namespace

bool isPin(const std::string &text)
{
    return text.size() == pin_prefix.size() + digest_base64_size && text.rfind(pin_prefix, 0) == 0 &&
           text.back() == '=' && text.find_first_not_of(base64_alphabet, pin_prefix.size()) == text.size() - 1;
}

int pinOfCertificate(const std::string &pem, const std::string &origin, std::string &pin)
{
    const LibCrypto *const crypto = libCrypto();
    if (!crypto)
        return NORV_ERR_CREATE_REQUEST;
    const std::unique_ptr<BIO, decltype(crypto->bio_free)> text(
        crypto->bio_new_mem_buf(pem.data(), static_cast<int>(pem.size())), crypto->bio_free);
    if (!text)
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for the certificate of %s", origin.c_str());
    const std::unique_ptr<X509, decltype(crypto->x509_free)> certificate(
        crypto->pem_read_bio_x509(text.get(), nullptr, nullptr, nullptr), crypto->x509_free);
    const std::string key = certificate ? publicKey(*crypto, certificate.get()) : std::string();
    if (key.empty())
        return fail(NORV_ERR_BAD_PARAMETER, "%s: no certificate that can be read", origin.c_str());
    pin = pinOfKey(key);
    return 0;
}

int learnPin(const std::string &host, uint16_t port, const std::string &pin)
{
    std::string known;
    if (int err = iscsihost::getPin(host, port, known))
        return err;
    if (pin.empty() || pin == known)
        return 0;
    if (!known.empty())
        return fail(NORV_ERR_NO_PERMISSION, "%s has the key %s here, not %s; if it was changed: %s",
                    authority(host, port).c_str(), known.c_str(), pin.c_str(), trustCommand(host).c_str());
    return iscsihost::setPin(host, port, pin);
}

std::string trustCommand(const std::string &host)
{
    return "iscsictl node trust " + host;
}

} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int getPin(const std::string &host, uint16_t port, std::string &pin)
{
    Query query("SELECT pin FROM pins WHERE host = ?1 AND port = ?2");
    const std::string name = lowerCase(host);
    const bool found = query.bind(name).bind(port).next();
    if (query.error())
        return query.error();
    pin = found ? query.text(0) : std::string_view();
    return 0;
}

int setPin(const std::string &host, uint16_t port, const std::string &pin)
{
    const std::string name = lowerCase(host);
    if (pin.empty()) {
        Query query("DELETE FROM pins WHERE host = ?1 AND port = ?2");
        return query.bind(name).bind(port).run();
    }
    if (!isHost(host))
        return fail(NORV_ERR_NODE_HOST, "host: '%s' is neither a host name nor an address", host.c_str());
    if (port == 0)
        return fail(NORV_ERR_NODE_PORT, "port: 0 is none");
    if (!isPin(pin))
        return fail(NORV_ERR_BAD_PARAMETER, "pin: '%s' is not sha256// and a base64 digest", pin.c_str());
    Query query("INSERT INTO pins VALUES (?1, ?2, ?3) ON CONFLICT DO UPDATE SET pin = excluded.pin");
    return query.bind(name).bind(port).bind(pin).run();
}

} // namespace iscsihost
