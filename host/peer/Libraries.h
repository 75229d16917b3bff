/// libcurl and OpenSSL, loaded when a peer is first talked to. Linked, they and the thirty libraries that they need
/// would make every start of a program 4 ms longer, and a request of the web API is a start of a program.
#pragma once

#include <curl/curl.h>
#include <openssl/pem.h>
#include <openssl/x509.h>

namespace norvhost {

/// The functions of libcurl that we call.
struct LibCurl {
    decltype(&curl_global_init) global_init;
    decltype(&curl_easy_init) init;
    decltype(&curl_easy_cleanup) cleanup;
    decltype(&curl_easy_setopt) setopt;
    decltype(&curl_easy_perform) perform;
    decltype(&curl_easy_getinfo) getinfo;
    decltype(&curl_easy_strerror) strerror;
    decltype(&curl_slist_append) slist_append;
    decltype(&curl_slist_free_all) slist_free_all;
};

/// The functions of OpenSSL's libcrypto that we call.
struct LibCrypto {
    decltype(&BIO_new_mem_buf) bio_new_mem_buf;
    decltype(&BIO_free) bio_free;
    decltype(&PEM_read_bio_X509) pem_read_bio_x509;
    decltype(&X509_free) x509_free;
    decltype(&X509_get_X509_PUBKEY) x509_get_x509_pubkey;
    decltype(&i2d_X509_PUBKEY) i2d_x509_pubkey;
};

// Null, with a reason, when the library cannot be loaded. A loaded one stays.

const LibCurl *libCurl();
const LibCrypto *libCrypto();

} // namespace norvhost
