#include "host/target/portal/Conversation.h"

#include "host/target/Lines.h"

#include <algorithm>
#include <cstring>

namespace norvhost::portal {
namespace {

constexpr int login_requests_max = 16;
constexpr size_t login_text_max = 16384;

enum LoginStage : uint8_t {
    security = 0,
    operational = 1,
    full_feature = 3,
};

enum RejectReason : uint8_t {
    protocol_error = 0x04,
    not_supported = 0x05,
    invalid_field = 0x09,
};

/// Answers to keys of the operational stage that say the same whatever was offered, each allowed by its key's rule.
constexpr TextKey fixed_answers[] = {
    {"HeaderDigest", "None"},    {"DataDigest", "None"},      {"MaxConnections", "1"},   {"InitialR2T", "Yes"},
    {"ImmediateData", "No"},     {"MaxOutstandingR2T", "1"},  {"DataPDUInOrder", "Yes"}, {"DataSequenceInOrder", "Yes"},
    {"DefaultTime2Retain", "0"}, {"ErrorRecoveryLevel", "0"}, {"IFMarker", "No"},        {"OFMarker", "No"},
};

/// Keys that are declared and not answered.
constexpr std::string_view declarations[] = {"InitiatorName", "InitiatorAlias", "SessionType", "TargetName",
                                             "AuthMethod"};

/// Keys whose value we take over when it is a number.
constexpr std::string_view accepted_numbers[] = {"MaxBurstLength", "FirstBurstLength", "DefaultTime2Wait"};

template <class Container>
bool contains(const Container &container, std::string_view value)
{
    return std::find(std::begin(container), std::end(container), value) != std::end(container);
}

} // namespace

Conversation::Conversation(Directory &directory, std::string address, int port)
    : directory(directory), address(std::move(address)), port(port)
{
}

void Conversation::receive(std::string_view &bytes)
{
    while (!over && !undecided && to_send.empty() && !bytes.empty()) {
        if (!reader.feed(bytes)) {
            over = true;
            return;
        }
        if (!reader.complete())
            return;
        handle(reader.pdu());
        reader.drop();
    }
}

void Conversation::handle(const Pdu &pdu)
{
    if (stage != Stage::full) {
        if (pdu.opcode() == op_login && pdu.immediate())
            handleLogin(pdu);
        else
            over = true;
        return;
    }
    switch (pdu.opcode()) {
    case op_text:
        return handleText(pdu);
    case op_nop_out:
        return handleNop(pdu);
    case op_logout:
        return handleLogout(pdu);
    case op_login:
        over = true;
        return;
    default:
        return reject(pdu, not_supported);
    }
}

void Conversation::handleLogin(const Pdu &pdu)
{
    memcpy(login_header, pdu.header, header_size);
    command_number = pdu.commandNumber();
    if (++login_requests > login_requests_max || login_text.size() + pdu.data.size() > login_text_max)
        return refuse(login_initiator_error);
    login_text.append(pdu.data);
    const uint8_t current = pdu.flags() >> 2 & 3;
    if (pdu.flags() & continue_bit) {
        if (pdu.flags() & final_bit)
            return refuse(login_initiator_error);
        return writeLogin(static_cast<uint8_t>(current << 2), login_ok, {}); // the rest of the text follows
    }

    std::vector<TextKey> keys;
    if (pdu.header[3] > 0)
        return refuse(login_unsupported_version);
    if (!parseText(login_text, keys) || (current != security && current != operational))
        return refuse(login_initiator_error);
    if (stage == Stage::start)
        answerFirstLogin(keys);
    else
        negotiate(keys);
    login_text.clear();
}

void Conversation::answerFirstLogin(const std::vector<TextKey> &keys)
{
    const std::string_view *const name = findKey(keys, "InitiatorName");
    const std::string_view *const type = findKey(keys, "SessionType");
    const std::string_view *const wanted = findKey(keys, "TargetName");
    if (!name)
        return refuse(login_missing_parameter);
    initiator = *name;
    if (type && *type == "Discovery") {
        if (login_header[14] || login_header[15])
            return refuse(login_no_session);
        stage = Stage::login;
        return negotiate(keys);
    }
    if (type && *type != "Normal")
        return refuse(login_bad_session_type);
    if (!wanted)
        return refuse(login_missing_parameter);
    target = *wanted;
    answerTarget();
}

void Conversation::answerTarget()
{
    const Decision decision = directory.decide(initiator, target);
    undecided = decision.later;
    if (undecided)
        return;
    if (decision.status != login_moved)
        return refuse(decision.status);
    std::string text;
    addKey(text, "TargetAddress", address + ":" + std::to_string(decision.port));
    writeLogin(0, login_moved, text);
    over = true;
}

void Conversation::retry()
{
    answerTarget();
}

void Conversation::giveUp()
{
    undecided = false;
    refuse(login_service_unavailable);
}

void Conversation::negotiate(const std::vector<TextKey> &keys)
{
    std::string answer;
    if (const std::string_view *const methods = findKey(keys, "AuthMethod")) {
        if (!listHolds(*methods, "None"))
            return refuse(login_not_authenticated);
        addKey(answer, "AuthMethod", "None");
    }
    for (const TextKey &entry : keys) {
        const auto fixed = std::find_if(std::begin(fixed_answers), std::end(fixed_answers),
                                        [&](const TextKey &known) { return known.key == entry.key; });
        uint32_t number;
        if (contains(declarations, entry.key)) {
            continue;
        } else if (entry.key == "MaxRecvDataSegmentLength") {
            if (!parseNumber(entry.value, number) || number < 512 || number > 16777215)
                return refuse(login_initiator_error);
            initiator_data_max = number;
            addKey(answer, entry.key, std::to_string(data_max));
        } else if (fixed != std::end(fixed_answers)) {
            addKey(answer, entry.key, fixed->value);
        } else if (contains(accepted_numbers, entry.key)) {
            addKey(answer, entry.key, parseNumber(entry.value, number) ? std::to_string(number) : "Reject");
        } else {
            addKey(answer, entry.key.substr(0, 63), "NotUnderstood");
        }
    }
    transit(answer);
}

void Conversation::transit(std::string_view answer)
{
    const uint8_t flags = login_header[1];
    const uint8_t current = flags >> 2 & 3, next = flags & 3;
    uint8_t response = static_cast<uint8_t>(current << 2);
    if (flags & final_bit) {
        if (next <= current || next == 2)
            return refuse(login_initiator_error);
        response = static_cast<uint8_t>(response | final_bit | next);
        if (next == full_feature)
            stage = Stage::full;
    }
    writeLogin(response, login_ok, answer);
}

void Conversation::writeLogin(uint8_t flags, LoginStatus status, std::string_view text)
{
    PduWriter response(op_login_response, flags);
    response.copy(8, login_header + 8, 8); // ISID and TSIH
    if (stage == Stage::full)
        response.half(14, 1);
    response.copy(16, login_header + 16, 4).word(24, status_number++);
    response.word(28, command_number).word(32, command_number + 1).half(36, status);
    response.write(to_send, text);
}

void Conversation::refuse(LoginStatus status)
{
    writeLogin(0, status, {});
    over = true;
}

void Conversation::countCommand(const Pdu &pdu)
{
    command_number = pdu.commandNumber() + (pdu.immediate() ? 0 : 1);
}

void Conversation::handleText(const Pdu &pdu)
{
    countCommand(pdu);
    text_tag = pdu.taskTag();
    if (pdu.transferTag() != reserved_tag) {
        if (text_left.empty() || pdu.transferTag() != text_transfer_tag)
            return reject(pdu, invalid_field);
        return sendText();
    }
    std::vector<TextKey> keys;
    if (!(pdu.flags() & final_bit) || pdu.flags() & continue_bit || !parseText(pdu.data, keys))
        return reject(pdu, protocol_error);
    text_left.clear();
    for (const TextKey &entry : keys) {
        if (entry.key == "SendTargets")
            listTargets(entry.value, text_left);
        else
            addKey(text_left, entry.key.substr(0, 63), "NotUnderstood");
    }
    sendText();
}

void Conversation::listTargets(std::string_view wanted, std::string &text)
{
    for (const std::string &name : directory.targetsFor(initiator)) {
        if (wanted != "All" && wanted != name)
            continue;
        addKey(text, "TargetName", name);
        addKey(text, "TargetAddress", address + ":" + std::to_string(port) + ",1");
    }
}

void Conversation::sendText()
{
    const std::string part = text_left.substr(0, initiator_data_max);
    text_left.erase(0, part.size());
    const bool last = text_left.empty();
    text_transfer_tag = last ? reserved_tag : (text_transfer_tag == 1 ? 2 : 1);
    PduWriter response(op_text_response, last ? final_bit : continue_bit);
    response.word(16, text_tag).word(20, text_transfer_tag).word(24, status_number++);
    response.word(28, command_number).word(32, command_number + 1);
    response.write(to_send, part);
}

void Conversation::handleNop(const Pdu &pdu)
{
    countCommand(pdu);
    if (pdu.taskTag() == reserved_tag)
        return;
    PduWriter response(op_nop_in, final_bit);
    response.copy(8, pdu.header + 8, 8).word(16, pdu.taskTag()).word(20, reserved_tag).word(24, status_number++);
    response.word(28, command_number).word(32, command_number + 1);
    response.write(to_send, pdu.data.substr(0, initiator_data_max));
}

void Conversation::handleLogout(const Pdu &pdu)
{
    countCommand(pdu);
    PduWriter response(op_logout_response, final_bit);
    response.word(16, pdu.taskTag()).word(24, status_number++);
    response.word(28, command_number).word(32, command_number + 1);
    response.write(to_send);
    over = true;
}

void Conversation::reject(const Pdu &pdu, uint8_t reason)
{
    PduWriter response(op_reject, final_bit);
    response.byte(2, reason).word(16, reserved_tag).word(24, status_number++);
    response.word(28, command_number).word(32, command_number + 1);
    response.write(to_send, {reinterpret_cast<const char *>(pdu.header), header_size});
}

} // namespace norvhost::portal
