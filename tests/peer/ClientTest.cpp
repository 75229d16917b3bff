#include "PeerTest.h"

#include "iscsiwebapi/ISCSIErrorCode.h"
#include "webapi/client/APILUN.h"

#include <gmock/gmock.h>

namespace norvhost {
namespace {

using ISCSI::ISCSINodeInfo;
using ISCSI::WebAPI::APILUN::WebAPIClientLUNDelete;
using ISCSI::WebAPI::APILUN::WebAPIClientLUNGet;
using testing::HasSubstr;

struct ClientTest : PeerTest {
    ISCSINodeInfo node{"", "t0ken", "127.0.0.1", badServer().port, "https", "", "", false};

    void SetUp() override { ASSERT_EQ(0, iscsihost::setPin("127.0.0.1", badServer().port, badServer().pin)); }

    /// Asks for a LUN whose UUID tells the server how to answer.
    int get(const std::string &behaviour)
    {
        return WebAPIClientLUNGet(node, behaviour, {"is_action_locked", "sync_progress"}).send();
    }
};

TEST_F(ClientTest, ReadsAGoodAnswer)
{
    WebAPIClientLUNGet get(node, "good", {"is_action_locked", "sync_progress"});
    ASSERT_EQ(0, get.send()) << reason();
    EXPECT_TRUE(get.isActionLocked());
    EXPECT_EQ(7u, get.syncProgress());
    EXPECT_EQ(0, WebAPIClientLUNDelete(node, "none").send()) << reason();
}

TEST_F(ClientTest, AnswersWithoutWhatWasAskedForAreBad)
{
    for (const char *behaviour :
         {"empty", "none", "half", "html", "html-inside", "huge-number", "infinite", "negative", "text-for-number",
          "number-for-bool", "missing", "array", "null", "deep", "deep-arrays", "two", "no-utf8", "chunk-garbage"}) {
        EXPECT_EQ(ISCSI::ERR_BAD_RESPONSE, get(behaviour)) << behaviour;
        EXPECT_THAT(reason(), HasSubstr("127.0.0.1")) << behaviour;
    }
}

TEST_F(ClientTest, RefusalsKeepTheirCodeAndReason)
{
    EXPECT_EQ(ISCSI::ERR_NO_SUCH_LUN, get("refused"));
    EXPECT_THAT(reason(), HasSubstr("404: gone?[2J")); // nothing that a terminal would act on
    for (const char *behaviour :
         {"no-code", "code-zero", "code-text", "code-huge", "code-array", "html-error", "redirect"})
        EXPECT_EQ(ISCSI::ERR_FAILED_TO_GET_ERROR_CODE, get(behaviour)) << behaviour;
}

TEST_F(ClientTest, RecordsCannotForgeRequests)
{
    // An identifier stays one segment: the server sees none of these as "good".
    for (const char *uuid : {"../good", "x/good", "x?a=/good", "good#", "x\r\nX: y", "x y"})
        EXPECT_EQ(ISCSI::ERR_BAD_RESPONSE, get(uuid)) << uuid;
    node.session_id = "t0ken\r\nX: y";
    EXPECT_EQ(ISCSI::ERR_FAILED_TO_CREATE_REQUEST, get("good"));
    node.session_id.clear();
    node.hostname = "127.0.0.1/x?";
    EXPECT_EQ(ISCSI::ERR_FAILED_TO_CREATE_REQUEST, get("good"));
    EXPECT_EQ(ISCSI::ERR_FAILED_TO_CREATE_REQUEST, WebAPIClientLUNDelete(ISCSINodeInfo(), "x").send());
}

} // namespace
} // namespace norvhost
