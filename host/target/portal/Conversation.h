/// The portal's side of one connection, without the connection: bytes in, bytes out.
#pragma once

#include "host/target/portal/Pdu.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace norvhost::portal {

/// What becomes of a login to a target.
struct Decision {
    LoginStatus status = login_service_unavailable;
    int port = 0;       ///< for login_moved: where to
    bool later = false; ///< cannot be told now, ask again in a moment
};

/// What initiators may know and do.
class Directory {
public:
    virtual ~Directory() = default;
    /// Names of the targets that the initiator may use.
    virtual std::vector<std::string> targetsFor(const std::string &initiator) = 0;
    virtual Decision decide(const std::string &initiator, const std::string &target) = 0;
};

/// Serves discovery sessions and answers the first login of a normal session by sending the initiator
/// elsewhere or away. Lives without trust in its input: every size is bounded before anything is
/// allocated for it, at most one request is worked on at a time, and anything unexpected ends it.
class Conversation {
public:
    /// `address` is the local end of the connection as it stands in a TargetAddress, IPv6 in brackets.
    Conversation(Directory &directory, std::string address, int port);

    /// Takes bytes, as many as it can deal with now; the rest stays in `bytes` until output() was sent.
    void receive(std::string_view &bytes);

    /// To be sent; the caller removes what it sent.
    std::string &output() { return to_send; }

    /// No more is received; the connection ends when output() is sent.
    bool finished() const { return over; }

    /// A decision could not be told; retry() asks again, giveUp() answers that the service is unavailable.
    bool waiting() const { return undecided; }
    void retry();
    void giveUp();

    /// Login is done: a discovery session that may be idle for a while.
    bool loggedIn() const { return stage == Stage::full; }

private:
    enum class Stage {
        start,
        login,
        full,
    };

    void handle(const Pdu &pdu);
    void handleLogin(const Pdu &pdu);
    void answerFirstLogin(const std::vector<TextKey> &keys);
    void answerTarget();
    void negotiate(const std::vector<TextKey> &keys);
    void transit(std::string_view answer);
    void handleText(const Pdu &pdu);
    void listTargets(std::string_view wanted, std::string &text);
    void sendText();
    void handleNop(const Pdu &pdu);
    void handleLogout(const Pdu &pdu);
    void reject(const Pdu &pdu, uint8_t reason);
    void writeLogin(uint8_t flags, LoginStatus status, std::string_view text);
    void refuse(LoginStatus status);
    void countCommand(const Pdu &pdu);

    Directory &directory;
    const std::string address;
    const int port;

    PduReader reader;
    std::string to_send;
    bool over = false;
    bool undecided = false;
    Stage stage = Stage::start;

    // The login request being answered.
    uint8_t login_header[header_size] = {};
    std::string login_text; ///< of all its requests so far
    int login_requests = 0;
    std::string initiator, target;

    // The session.
    uint32_t status_number = 0;
    uint32_t command_number = 0; ///< the next one expected
    size_t initiator_data_max = data_max;

    // A text answer that takes several responses.
    std::string text_left;
    uint32_t text_tag = 0;
    uint32_t text_transfer_tag = reserved_tag;
};

} // namespace norvhost::portal
