#include "host/peer/Libraries.h"

#include "host/core/LastError.h"
#include "platform/error.h"

#include <dlfcn.h>
#include <mutex>
#include <openssl/opensslv.h>

namespace norvhost {
namespace {

/// Finds functions in one library; the first failure counts.
class Library {
public:
    explicit Library(const char *name) : name(name), handle(dlopen(name, RTLD_LAZY | RTLD_LOCAL)) { check(handle); }

    template <class Function>
    Library &find(const char *symbol, Function &function)
    {
        if (good) {
            function = reinterpret_cast<Function>(dlsym(handle, symbol));
            check(function != nullptr);
        }
        return *this;
    }

    bool ok() const { return good; }

private:
    void check(bool done)
    {
        good = done;
        if (!done)
            fail(NORV_ERR_CREATE_REQUEST, "cannot load %s: %s", name, dlerror());
    }

    const char *name;
    void *handle;
    bool good = false;
};

bool load(LibCurl &curl)
{
    const bool found = Library("libcurl.so.4")
                           .find("curl_global_init", curl.global_init)
                           .find("curl_easy_init", curl.init)
                           .find("curl_easy_cleanup", curl.cleanup)
                           .find("curl_easy_setopt", curl.setopt)
                           .find("curl_easy_perform", curl.perform)
                           .find("curl_easy_getinfo", curl.getinfo)
                           .find("curl_easy_strerror", curl.strerror)
                           .find("curl_slist_append", curl.slist_append)
                           .find("curl_slist_free_all", curl.slist_free_all)
                           .ok();
    if (!found)
        return false;
    if (curl.global_init(CURL_GLOBAL_DEFAULT) == CURLE_OK)
        return true;
    fail(NORV_ERR_CREATE_REQUEST, "libcurl does not start");
    return false;
}

static_assert(OPENSSL_SHLIB_VERSION == 3, "the number in the library's name");

bool load(LibCrypto &crypto)
{
    return Library("libcrypto.so.3")
        .find("BIO_new_mem_buf", crypto.bio_new_mem_buf)
        .find("BIO_free", crypto.bio_free)
        .find("PEM_read_bio_X509", crypto.pem_read_bio_x509)
        .find("X509_free", crypto.x509_free)
        .find("X509_get_X509_PUBKEY", crypto.x509_get_x509_pubkey)
        .find("i2d_X509_PUBKEY", crypto.i2d_x509_pubkey)
        .ok();
}

/// The functions, loaded once; after a failure the next call tries again and gives the reason again.
template <class Functions>
const Functions *loaded()
{
    static std::mutex one_at_a_time;
    const std::lock_guard<std::mutex> lock(one_at_a_time);
    static Functions functions;
    static bool done = false;
    done = done || load(functions);
    return done ? &functions : nullptr;
}

} // namespace

const LibCurl *libCurl()
{
    return loaded<LibCurl>();
}

const LibCrypto *libCrypto()
{
    return loaded<LibCrypto>();
}

} // namespace norvhost
