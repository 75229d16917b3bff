/// Requests to the web API of another appliance: the one place that speaks HTTP as a client.
#pragma once

#include <cstdint>
#include <iscsihost/host.h>
#include <json/value.h>
#include <string>

namespace iscsihost {

/// What is asked of whom.
struct HttpsRequest {
    std::string host; ///< name or address, without brackets
    uint16_t port = 0;
    std::string protocol;       ///< "https"; "http" only to a loopback address
    std::string method = "GET"; ///< as on the wire
    std::string path;           ///< with query, percent-encoded: "/api/v1/luns?status=true"
    std::string token;          ///< session token, empty for none
    std::string body;           ///< JSON, empty for none
    std::string pin;            ///< the server's key, as in getPin(); empty: the one pinned for its host and port
    int connect_seconds = 10;   ///< limit of connecting, TLS included
    int stall_seconds = 60; ///< limit of waiting while less than a byte a second moves; a request has no other limit
};

struct HttpsAnswer {
    int status = 0; ///< HTTP status
    std::string content_type;
    std::string body; ///< bounded: an answer above 64 MiB is refused
};

/// Sends one request and waits for its answer, over TLS 1.2 or later. Redirections are answers like others, and proxies
/// of the environment are not used. The server's key must be the one pinned for its host and port, and then its
/// certificate says nothing; without a pin the certificate must be valid, for the host, by the machine's certificate
/// authorities. Failures have a reason with the host in it, and both keys when the server's has changed; no secret is
/// in it.
/// - 18990207 (NORV_ERR_CREATE_REQUEST): a field cannot be sent as it is; nothing was sent.
/// - 18990211 (NORV_ERR_SEND_REQUEST): not reached, not trusted, or no answer in time.
/// - 18990204 (NORV_ERR_BAD_RESPONSE): the answer is cut short, too large, or no HTTP.
ISCSI_HOST_API int https(const HttpsRequest &request, HttpsAnswer &answer);

/// Calls the web API of an appliance: https(), whose answer is JSON, nested at most 16 deep. `value` is null for an
/// answer without content. Beside the codes of https(): the code that a refusal carries, with the server's reason for
/// it; 18990212 (NORV_ERR_GET_ERROR_CODE) for a refusal without one; 18990204 for an answer that is not JSON.
ISCSI_HOST_API int callApi(const HttpsRequest &request, Json::Value &value);

/// 18990204 for an answer of callApi() that lacks what was asked for, with its reason.
ISCSI_HOST_API int incompleteAnswer(const HttpsRequest &request);

/// The key that a server shows now, whoever it is: SHA-256 of its public key (DER, SubjectPublicKeyInfo) in base64, as
/// "sha256//..." - the form that pins have.
ISCSI_HOST_API int fetchPin(const std::string &host, uint16_t port, std::string &pin);

/// The pin of a host and port; empty when there is none.
ISCSI_HOST_API int getPin(const std::string &host, uint16_t port, std::string &pin);

/// Stores a pin in place of an earlier one; empty removes it.
ISCSI_HOST_API int setPin(const std::string &host, uint16_t port, const std::string &pin);

} // namespace iscsihost
