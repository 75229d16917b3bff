/// The keys that peers' web servers are known by.
///
/// A pin is the SHA-256 of a public key (DER, SubjectPublicKeyInfo) in base64: "sha256//" and 44 characters.
#pragma once

#include <cstdint>
#include <string>

namespace norvhost {

bool isPin(const std::string &text);

/// The pin of the first certificate in a text of PEM; what is not a certificate is passed over.
/// NORV_ERR_BAD_PARAMETER when there is none; `origin` names the text in the reason.
int pinOfCertificate(const std::string &pem, const std::string &origin, std::string &pin);

/// Stores the pin of a node that another appliance told of, unless another key is pinned for its host and port:
/// NORV_ERR_NO_PERMISSION then, because only this appliance's administrator may trust a changed key.
int learnPin(const std::string &host, uint16_t port, const std::string &pin);

/// The command by which the administrator trusts the key that a node's server shows.
std::string trustCommand(const std::string &host);

} // namespace norvhost
