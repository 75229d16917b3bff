#include "iscsiwebapi/ISCSIErrorCode.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <utility>

namespace {

TEST(ErrorCodes, OwnCodesHaveTheirTexts)
{
    // The ends of every range, so that a text too many or too few shows, and texts whose odd spelling is interface.
    const struct {
        int code;
        const char *text;
    } cases[] = {{18990000, "Default error code"},
                 {18990025, "Failed to copy string"},
                 {ISCSI::ERR_FAILED_TO_CERATE_DIRECTORY, "Failed to cerate directory"},
                 {18990057, "Failed to truncate file"},
                 {18990200, "No such API"},
                 {18990213, "Not implemented yet"},
                 {18990300, "Failed to get volume info"},
                 {18990316, "Failed to get space device size"},
                 {18990400, "Bad EP file type"},
                 {18990404, "Bad deleted_by"},
                 {18990426, "Failed to generate UUID"},
                 {18990500, "Bad LUN type"},
                 {18990508, "Bad source LUN UUID"},
                 {18990529, "Bad is_for_unsync_size"},
                 {18990530, "No LUN UUID"},
                 {18990547, "Snapshot is locked"},
                 {18990557, "Failed to list LUN"},
                 {18990570, "Failed to map target"},
                 {18990582, "Failed to update LUN"},
                 {18990595, "Failed to finish mapping file operation"},
                 {18990700, "Bad target name"},
                 {18990713, "No such target"},
                 {18990733, "Failed to enable isert"},
                 {18990800, "Not a source task"},
                 {18990820, "Bad source LUN UUID"},
                 {18990822, "Bad source Node UUID"},
                 {18990854, "Bad sending_snapshot_uuid"},
                 {18990887, "Failed to compute unsync size"},
                 {18991000, "Bad vLUN type"},
                 {18991009, "Failed to unload NAA"},
                 {18991100, "Bad node UUID"},
                 {ISCSI::ERR_INVAILD_NET_FAMILY, "Invaild net family"},
                 {18991121, "Failed to get address info"}};
    for (const auto &c : cases)
        EXPECT_STREQ(ISCSI::ErrorCodeToString(c.code), c.text) << c.code;
}

TEST(ErrorCodes, OtherCodesAreErrnoValues)
{
    const std::pair<int, int> cases[] = {
        {0, 0}, {2, 2}, {-1, 1}, {-2, 2}, {-255, 255}, {-256, -256}, {INT32_MIN, INT32_MIN}, {INT32_MAX, INT32_MAX}};
    for (const auto &[code, number] : cases)
        EXPECT_EQ(ISCSI::ErrorCodeToString(code), std::string(strerror(number))) << code;
    for (int beside_a_range : {18989999, 18990058, 18990199, 18990214, 18990596, 18991010, 18991122})
        EXPECT_EQ(ISCSI::ErrorCodeToString(beside_a_range), std::string(strerror(beside_a_range)));
}

} // namespace
