/// The web server of the web API: where it listens, its certificate, and running it.
#pragma once

#include <cstdint>
#include <iscsihost/host.h>
#include <string>

namespace iscsihost {

/// Where the web server listens.
struct WebListener {
    std::string address = "all"; ///< an IP address, or "all" for every address of the machine
    uint16_t port = 5443;
};

/// Takes effect when the web server starts.
ISCSI_HOST_API int setWebListener(const WebListener &listener);
ISCSI_HOST_API int getWebListener(WebListener &listener);

/// The certificate that the web server shows. Its key never leaves the state folder.
struct WebCertificate {
    std::string path;    ///< the file with key and certificates, PEM
    std::string subject; ///< as openssl prints it
    std::string names;   ///< subject alternative names
    std::string ends;    ///< last moment of its validity
    std::string pin;     ///< of its key: what a peer compares when it joins, in the form of https.h
};

/// Makes a key (EC P-256) and a certificate for the machine's name, signed by itself, in place of what was there.
/// Peers that pinned the former key refuse the new one. Takes effect when the web server starts.
ISCSI_HOST_API int makeWebCertificate();

/// Takes a certificate, with its chain behind it, and the key that belongs to it, both PEM. Nothing changes when they
/// do not fit together.
ISCSI_HOST_API int setWebCertificate(const std::string &certificate_file, const std::string &key_file);

/// NORV_ERR_FILE_NOT_FOUND while there is none.
ISCSI_HOST_API int getWebCertificate(WebCertificate &certificate);

/// Makes a certificate if there is none, and becomes the web server, in the foreground; returns only when that failed.
/// What it serves and how is in its configuration, which is installed beside the CGI program; $ISCSI_HOST_WEBAPI names
/// another folder that holds both.
ISCSI_HOST_API int runWebServer();

} // namespace iscsihost
