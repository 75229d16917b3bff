// JSON as a web client sends it, into the LUN record and into a target's access list.
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBTarget.h"
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "tests/fake/Fake.h"
#include "tests/fake/Process.h"
#include "tests/fuzz/Expect.h"

#include <json/reader.h>

#include <memory>

using ISCSI::ISCSILUNInfo;
using ISCSI::LIB::LIBTarget::ISCSILIBTarget;

namespace {

void readLUN(const Json::Value &json)
{
    ISCSILUNInfo lun("11111111-2222-3333-4444-555555555555");
    const std::string before = lun.toString();
    const int code = lun.loadFromJson(json);
    if (code) {
        EXPECT_ALWAYS(code == ISCSI::ERR_INVALID_INPUT);
        EXPECT_ALWAYS(lun.toString() == before);
        return;
    }
    Json::Value written;
    if (lun.isInvalid() || lun.toJsonFormat(written))
        return;
    ISCSILUNInfo again;
    EXPECT_ALWAYS(again.loadFromJson(written) == 0);
    EXPECT_ALWAYS(again.toString() == lun.toString());
}

void setMasks(const Json::Value &json)
{
    fake::reset();
    fake::Target &target = fake::model().targets[1];
    target.record.tid = 1;
    target.masking = {{"iqn.2000-01.com.example:a", NORV_AUTHORITY_READ_WRITE}};
    const auto before = target.masking;

    const int code = ISCSILIBTarget::ACLMasksSet(1, json);
    const auto &after = fake::model().targets[1].masking;
    if (code == ISCSI::ERR_INVALID_INPUT || code == ISCSI::ERR_BAD_TARGET_AUTH_INFO)
        EXPECT_ALWAYS(after == before);
    for (const auto &entry : after)
        EXPECT_ALWAYS(!entry.first.empty() && entry.first.size() <= 255);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    const char *text = reinterpret_cast<const char *>(data);
    Json::CharReaderBuilder builder;
    builder["stackLimit"] = 100;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    Json::Value json;
    std::string errors;
    try {
        if (!reader->parse(text, text + size, &json, &errors))
            return 0;
    } catch (const Json::Exception &) {
        return 0; // nested too deeply: the parser's caller hears of it, the library never sees it
    }
    readLUN(json);
    setMasks(json);
    fake::forgetCalls();
    fake::forgetLogLines();
    return 0;
}
