#include "iscsihost/https.h"

#include "host/core/LastError.h"
#include "host/core/PipeSignalBlock.h"
#include "host/peer/Address.h"
#include "host/peer/Libraries.h"
#include "host/peer/Pins.h"
#include "platform/error.h"

#include <algorithm>
#include <exception>
#include <memory>

namespace norvhost {
namespace {

using iscsihost::HttpsAnswer;
using iscsihost::HttpsRequest;

constexpr size_t body_max = 64 << 20;
constexpr size_t headers_max = 64 << 10;
constexpr const char *too_large = "it is larger than 64 MiB";

/// A connection to one server, for one request.
class Exchange {
public:
    Exchange(const std::string &host, uint16_t port) : server(authority(host, port)), host(host) {}
    ~Exchange();
    Exchange(const Exchange &) = delete;
    Exchange &operator=(const Exchange &) = delete;

    int begin(const std::string &protocol, const std::string &path, int connect_seconds);
    /// The server's key must be this one. `advice` tells how another one is trusted; it may be empty.
    void requirePin(const std::string &pin, const std::string &advice);
    /// Any key and certificate will do.
    void acceptAnyKey();

    int request(const HttpsRequest &request, HttpsAnswer &answer);
    int fetchPin(std::string &pin);

private:
    static size_t takeHeader(char *data, size_t size, size_t count, void *exchange);
    static size_t takeBody(char *data, size_t size, size_t count, void *exchange);

    template <class Value>
    void set(CURLoption option, Value value)
    {
        set_all = curl->setopt(handle, option, value) == CURLE_OK && set_all;
    }
    void addHeader(const std::string &line);
    int perform();
    int failed(CURLcode result);
    int seenPin(std::string &pin);

    const PipeSignalBlock block; ///< also while the connection is closed
    const std::string server;
    const std::string host;
    const LibCurl *curl = nullptr;
    CURL *handle = nullptr;
    curl_slist *headers = nullptr;
    bool set_all = true;
    std::string expected_pin, pin_advice;
    char message[CURL_ERROR_SIZE] = "";

    size_t header_bytes = 0;
    bool headers_ended = false;
    std::string body;
    const char *refused = nullptr; ///< why we stopped reading
};

Exchange::~Exchange()
{
    if (handle)
        curl->cleanup(handle);
    if (headers)
        curl->slist_free_all(headers);
}

int Exchange::begin(const std::string &protocol, const std::string &path, int connect_seconds)
{
    curl = libCurl();
    if (!curl)
        return NORV_ERR_CREATE_REQUEST;
    handle = curl->init();
    if (!handle)
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for a request to %s", server.c_str());
    set(CURLOPT_URL, (protocol + "://" + server + path).c_str());
    set(CURLOPT_PROTOCOLS_STR, protocol.c_str());
    set(CURLOPT_PATH_AS_IS, 1L);
    set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
    set(CURLOPT_FOLLOWLOCATION, 0L);
    set(CURLOPT_PROXY, "");
    set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    set(CURLOPT_CERTINFO, 1L);
    set(CURLOPT_CONNECTTIMEOUT, static_cast<long>(connect_seconds));
    set(CURLOPT_ERRORBUFFER, message);
    set(CURLOPT_NOSIGNAL, 1L); // else one thread takes away what another has set
    return 0;
}

void Exchange::requirePin(const std::string &pin, const std::string &advice)
{
    acceptAnyKey();
    expected_pin = pin;
    pin_advice = advice;
    set(CURLOPT_PINNEDPUBLICKEY, pin.c_str());
}

void Exchange::acceptAnyKey()
{
    set(CURLOPT_SSL_VERIFYPEER, 0L);
    set(CURLOPT_SSL_VERIFYHOST, 0L);
    set(CURLOPT_CAINFO, nullptr); // reading the machine's authorities takes longer than the request
    set(CURLOPT_CAPATH, nullptr);
}

void Exchange::addHeader(const std::string &line)
{
    curl_slist *const longer = curl->slist_append(headers, line.c_str());
    set_all = set_all && longer;
    if (longer)
        headers = longer;
}

int Exchange::request(const HttpsRequest &request, HttpsAnswer &answer)
{
    set(CURLOPT_CUSTOMREQUEST, request.method.c_str());
    if (!request.body.empty() || request.method == "POST") {
        set(CURLOPT_POSTFIELDS, request.body.c_str());
        set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(request.body.size()));
        addHeader("Content-Type: application/json");
        addHeader("Expect:"); // no round trip before the body
    }
    addHeader("Accept: application/json, application/problem+json");
    if (!request.token.empty())
        addHeader("Authorization: Bearer " + request.token);
    set(CURLOPT_HTTPHEADER, headers);
    set(CURLOPT_LOW_SPEED_LIMIT, 1L);
    set(CURLOPT_LOW_SPEED_TIME, static_cast<long>(request.stall_seconds));
    set(CURLOPT_MAXFILESIZE_LARGE, static_cast<curl_off_t>(body_max)); // where the server declares the size
    set(CURLOPT_HEADERFUNCTION, takeHeader);
    set(CURLOPT_HEADERDATA, this);
    set(CURLOPT_WRITEFUNCTION, takeBody);
    set(CURLOPT_WRITEDATA, this);
    if (int err = perform())
        return err;
    if (!headers_ended) // libcurl takes what there is when the connection ends among them
        return fail(NORV_ERR_BAD_RESPONSE, "bad answer from %s: its headers are cut short", server.c_str());

    long status = 0;
    const char *type = nullptr;
    curl->getinfo(handle, CURLINFO_RESPONSE_CODE, &status);
    curl->getinfo(handle, CURLINFO_CONTENT_TYPE, &type);
    answer.status = static_cast<int>(status);
    answer.content_type = type ? type : "";
    answer.body = std::move(body);
    return 0;
}

int Exchange::fetchPin(std::string &pin)
{
    set(CURLOPT_CONNECT_ONLY, 1L);
    if (int err = perform())
        return err;
    return seenPin(pin);
}

int Exchange::perform()
{
    if (!set_all)
        return fail(NORV_ERR_CREATE_REQUEST, "cannot make a request to %s", server.c_str());
    const CURLcode result = curl->perform(handle);
    return result == CURLE_OK ? 0 : failed(result);
}

int Exchange::failed(CURLcode result)
{
    const char *const why = refused ? refused : *message ? message : curl->strerror(result);
    std::string seen;
    switch (result) {
    case CURLE_SSL_PINNEDPUBKEYNOTMATCH:
        if (int err = seenPin(seen))
            return err;
        return fail(NORV_ERR_SEND_REQUEST, "the key of %s has changed: expected %s, it shows %s%s", server.c_str(),
                    expected_pin.c_str(), seen.c_str(), pin_advice.c_str());
    case CURLE_PEER_FAILED_VERIFICATION:
        return fail(NORV_ERR_SEND_REQUEST, "%s is not trusted: %s; to trust its key: %s", server.c_str(), why,
                    trustCommand(host).c_str());
    case CURLE_OPERATION_TIMEDOUT:
        return fail(NORV_ERR_SEND_REQUEST, "no answer from %s: %s", server.c_str(), why);
    case CURLE_OUT_OF_MEMORY:
        return fail(NORV_ERR_OUT_OF_MEMORY, "request to %s: %s", server.c_str(), why);
    case CURLE_UNSUPPORTED_PROTOCOL: // what came was no HTTP/1
    case CURLE_WEIRD_SERVER_REPLY:
        return fail(NORV_ERR_BAD_RESPONSE, "bad answer from %s: %s", server.c_str(), why);
    case CURLE_FILESIZE_EXCEEDED:
        return fail(NORV_ERR_BAD_RESPONSE, "bad answer from %s: %s", server.c_str(), too_large);
    default:
        if (header_bytes > 0)
            return fail(NORV_ERR_BAD_RESPONSE, "bad answer from %s: %s", server.c_str(), why);
        return fail(NORV_ERR_SEND_REQUEST, "cannot talk to %s: %s", server.c_str(), why);
    }
}

int Exchange::seenPin(std::string &pin)
{
    curl_certinfo *chain = nullptr;
    constexpr std::string_view label = "Cert:";
    if (curl->getinfo(handle, CURLINFO_CERTINFO, &chain) == CURLE_OK && chain && chain->num_of_certs > 0)
        for (const curl_slist *line = chain->certinfo[0]; line; line = line->next)
            if (std::string_view(line->data).substr(0, label.size()) == label)
                return pinOfCertificate(line->data + label.size(), server, pin);
    return fail(NORV_ERR_SEND_REQUEST, "%s shows no certificate", server.c_str());
}

size_t Exchange::takeHeader(char *data, size_t size, size_t count, void *exchange)
{
    auto *self = static_cast<Exchange *>(exchange);
    self->header_bytes += size * count;
    self->headers_ended = self->headers_ended || *data == '\r' || *data == '\n';
    if (self->header_bytes <= headers_max)
        return size * count;
    self->refused = "its headers are longer than 64 KiB";
    return 0;
}

size_t Exchange::takeBody(char *data, size_t size, size_t count, void *exchange)
{
    auto *self = static_cast<Exchange *>(exchange);
    if (size * count > body_max - self->body.size()) {
        self->refused = too_large;
        return 0;
    }
    try {
        self->body.append(data, size * count);
    } catch (const std::exception &) {
        self->refused = "no memory for it";
        return 0;
    }
    return size * count;
}

/// RFC 6750, 2.1. Nothing that ends a header line is in it.
bool isToken(const std::string &text)
{
    return std::all_of(text.begin(), text.end(), [](char c) {
        return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') ||
               std::string_view("-._~+/=").find(c) != std::string_view::npos;
    });
}

/// Path and query as RFC 3986 has them: no space, no control character, no fragment, nothing beyond ASCII.
bool isPath(const std::string &text)
{
    return text[0] == '/' && std::all_of(text.begin(), text.end(), [](char c) {
               return c > ' ' && c < 0x7f && std::string_view("\"#<>\\^`{|}").find(c) == std::string_view::npos;
           });
}

int checkServer(const std::string &host, uint16_t port)
{
    if (!isHost(host))
        return fail(NORV_ERR_CREATE_REQUEST, "host: '%s' is neither a host name nor an address", host.c_str());
    if (port == 0)
        return fail(NORV_ERR_CREATE_REQUEST, "port: 0 is none");
    return 0;
}

int check(const HttpsRequest &request)
{
    if (int err = checkServer(request.host, request.port))
        return err;
    const std::string &protocol = request.protocol;
    if (protocol != "https" && !(protocol == "http" && isLoopbackAddress(request.host)))
        return fail(NORV_ERR_CREATE_REQUEST, "protocol: '%s' to %s; only https is possible", protocol.c_str(),
                    request.host.c_str());
    const std::string &method = request.method;
    if (method != "GET" && method != "POST" && method != "PUT" && method != "PATCH" && method != "DELETE")
        return fail(NORV_ERR_CREATE_REQUEST, "method: '%s' is none", method.c_str());
    if (!isPath(request.path))
        return fail(NORV_ERR_CREATE_REQUEST, "path: '%s' cannot be sent", request.path.c_str());
    if (!isToken(request.token))
        return fail(NORV_ERR_CREATE_REQUEST, "token: it has characters that a token cannot have");
    if (!request.pin.empty() && !isPin(request.pin))
        return fail(NORV_ERR_CREATE_REQUEST, "pin: '%s' is none", request.pin.c_str());
    return 0;
}

} // namespace
} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int https(const HttpsRequest &request, HttpsAnswer &answer)
{
    if (int err = check(request))
        return err;
    std::string pin = request.pin;
    std::string advice;
    if (pin.empty() && request.protocol == "https") {
        if (int err = getPin(request.host, request.port, pin))
            return err;
        advice = "; if that is right: " + trustCommand(request.host);
    }
    Exchange exchange(request.host, request.port);
    if (int err = exchange.begin(request.protocol, request.path, request.connect_seconds))
        return err;
    if (!pin.empty())
        exchange.requirePin(pin, advice);
    return exchange.request(request, answer);
}

int fetchPin(const std::string &host, uint16_t port, std::string &pin)
{
    if (int err = checkServer(host, port))
        return err;
    Exchange exchange(host, port);
    if (int err = exchange.begin("https", "/", HttpsRequest().connect_seconds))
        return err;
    exchange.acceptAnyKey();
    return exchange.fetchPin(pin);
}

} // namespace iscsihost
