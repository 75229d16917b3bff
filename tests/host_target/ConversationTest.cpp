#include "host/target/portal/Conversation.h"

#include <gtest/gtest.h>

namespace norvhost::portal {
namespace {

struct FakeDirectory : Directory {
    std::vector<std::string> targets = {"iqn.2026-01.example:one", "iqn.2026-01.example:two"};
    Decision decision;

    std::vector<std::string> targetsFor(const std::string &) override { return targets; }
    Decision decide(const std::string &, const std::string &) override { return decision; }
};

struct Answer {
    uint8_t opcode, flags;
    uint16_t status;
    uint32_t transfer_tag;
    std::string data;
};

class ConversationTest : public testing::Test {
protected:
    FakeDirectory directory;
    Conversation conversation{directory, "192.0.2.1", 3260};

    static std::string pdu(uint8_t opcode, uint8_t flags, const std::string &data, uint32_t transfer_tag = reserved_tag)
    {
        std::string output;
        PduWriter(static_cast<Opcode>(opcode), flags)
            .word(16, 7)
            .word(20, transfer_tag)
            .word(24, 100)
            .write(output, data);
        return output;
    }

    static std::string login(uint8_t flags, const std::string &text) { return pdu(0x40 | op_login, flags, text); }

    /// Sends, and reads the only answer.
    Answer say(const std::string &request)
    {
        std::string_view bytes = request;
        conversation.receive(bytes);
        EXPECT_TRUE(bytes.empty());
        const std::string output = conversation.output();
        conversation.output().clear();
        if (output.size() < header_size)
            return {0, 0, 0xffff, 0, ""};
        const Pdu answer = {reinterpret_cast<const uint8_t *>(output.data()),
                            std::string_view(output).substr(header_size)};
        const size_t size = answer.word(4) & 0xffffff;
        EXPECT_EQ(output.size(), header_size + (size + 3) / 4 * 4);
        return {answer.opcode(), answer.flags(), answer.half(36), answer.word(20), output.substr(header_size, size)};
    }

    static std::string text(std::initializer_list<const char *> entries)
    {
        std::string all;
        for (const char *entry : entries)
            all += std::string(entry) + '\0';
        return all;
    }

    void discover(const char *data_max = "MaxRecvDataSegmentLength=512")
    {
        EXPECT_EQ(say(login(0x81, text({"InitiatorName=iqn.2026-01.example:a", "SessionType=Discovery",
                                        "AuthMethod=CHAP,None"})))
                      .data,
                  text({"AuthMethod=None"}));
        const Answer answer = say(login(0x87, text({"HeaderDigest=CRC32C,None", "X-key=1", data_max})));
        EXPECT_EQ(answer.flags, 0x87);
        EXPECT_EQ(answer.data, text({"HeaderDigest=None", "X-key=NotUnderstood", "MaxRecvDataSegmentLength=8192"}));
        EXPECT_TRUE(conversation.loggedIn());
    }
};

TEST_F(ConversationTest, ANormalLoginIsSentOn)
{
    directory.decision.status = login_moved;
    directory.decision.port = 3261;
    const std::string whole = text({"InitiatorName=iqn.2026-01.example:a", "TargetName=iqn.2026-01.example:one"});
    // In two requests, the first of which says that more follows.
    const Answer more = say(login(0x40, whole.substr(0, 20)));
    EXPECT_EQ(more.status, login_ok);
    EXPECT_EQ(more.flags & final_bit, 0);
    const Answer answer = say(login(0x81, whole.substr(20)));
    EXPECT_EQ(answer.status, login_moved);
    EXPECT_EQ(answer.data, text({"TargetAddress=192.0.2.1:3261"}));
    EXPECT_TRUE(conversation.finished());
}

TEST_F(ConversationTest, ADecisionMayTakeTime)
{
    directory.decision.later = true;
    const std::string request = login(0x81, text({"InitiatorName=a", "TargetName=b"}));
    EXPECT_EQ(say(request).status, 0xffff);
    EXPECT_TRUE(conversation.waiting());
    conversation.retry();
    EXPECT_TRUE(conversation.waiting());
    directory.decision.later = false;
    directory.decision.status = login_not_found;
    conversation.retry();
    EXPECT_TRUE(conversation.finished());
    EXPECT_EQ(say("").status, login_not_found);
}

TEST_F(ConversationTest, BadLoginsAreRefused)
{
    const std::string name = "InitiatorName=iqn.2026-01.example:a";
    std::string newer = login(0x81, text({name.c_str()})),
                second_connection = login(0x81, text({name.c_str(), "SessionType=Discovery"}));
    newer[3] = 1;
    second_connection[15] = 1;
    const std::pair<std::string, uint16_t> bad[] = {
        {login(0x81, text({"TargetName=x"})), login_missing_parameter},
        {login(0x81, text({name.c_str()})), login_missing_parameter},
        {login(0x81, text({name.c_str(), "SessionType=Other"})), login_bad_session_type},
        {login(0x81, text({name.c_str(), name.c_str()})), login_initiator_error},
        {login(0x81, "no key"), login_initiator_error},
        {login(0x8d, text({name.c_str()})), login_initiator_error},
        {login(0xc1, text({name.c_str()})), login_initiator_error},
        {login(0x81, text({name.c_str(), "SessionType=Discovery", "AuthMethod=CHAP"})), login_not_authenticated},
        {newer, login_unsupported_version},
        {second_connection, login_no_session},
    };
    for (const auto &[request, status] : bad) {
        Conversation fresh(directory, "192.0.2.1", 3260);
        std::string_view bytes = request;
        fresh.receive(bytes);
        EXPECT_TRUE(fresh.finished());
        EXPECT_EQ((Pdu{reinterpret_cast<const uint8_t *>(fresh.output().data()), {}}.half(36)), status) << request;
    }
}

TEST_F(ConversationTest, AnAnswerTakesAsManyResponsesAsTheInitiatorsLimitWants)
{
    directory.targets.assign(20, "iqn.2026-01.example:" + std::string(100, 'x'));
    discover();
    Answer answer = say(pdu(op_text, final_bit, text({"SendTargets=All"})));
    std::string all = answer.data;
    int responses = 1;
    for (; !(answer.flags & final_bit) && responses < 50; ++responses) {
        EXPECT_EQ(answer.data.size(), 512u);
        EXPECT_TRUE(answer.flags & continue_bit);
        answer = say(pdu(op_text, final_bit, "", answer.transfer_tag));
        all += answer.data;
    }
    EXPECT_GT(responses, 5);
    EXPECT_EQ(answer.transfer_tag, reserved_tag);
    std::string expected;
    for (const std::string &target : directory.targets) {
        addKey(expected, "TargetName", target);
        addKey(expected, "TargetAddress", "192.0.2.1:3260,1");
    }
    EXPECT_EQ(all, expected);
    EXPECT_EQ(say(pdu(op_text, final_bit, "", 1)).opcode, op_reject) << "nothing is left to be sent";
}

TEST_F(ConversationTest, ASessionAnswersPingsAndLogout)
{
    discover();
    EXPECT_EQ(say(pdu(op_text, final_bit, text({"SendTargets=iqn.2026-01.example:two"}))).data,
              text({"TargetName=iqn.2026-01.example:two", "TargetAddress=192.0.2.1:3260,1"}));
    EXPECT_EQ(say(pdu(op_nop_out, final_bit, "ping")).data, "ping");
    EXPECT_EQ(say(pdu(0x01, final_bit, "")).opcode, op_reject) << "a SCSI command";
    EXPECT_FALSE(conversation.finished());
    EXPECT_EQ(say(pdu(op_logout, final_bit, "")).opcode, op_logout_response);
    EXPECT_TRUE(conversation.finished());
}

TEST_F(ConversationTest, NothingIsReadWhileAnAnswerWaits)
{
    discover();
    const std::string ping = pdu(op_nop_out, final_bit, "ping"), two = ping + ping;
    std::string_view bytes = two;
    conversation.receive(bytes);
    EXPECT_EQ(bytes.size(), ping.size());
}

} // namespace
} // namespace norvhost::portal
