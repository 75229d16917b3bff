#include "etc/Text.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "tests/unit/Library.h"

#include <fstream>

namespace unit {
namespace {

using ISCSI::FormatSize;
using ISCSI::StringCopy;

TEST(Text, SizesAreChainsOfBinaryUnits)
{
    const struct {
        uint64_t bytes;
        const char *text;
    } cases[] = {{0, "0bytes"},
                 {1, "1bytes"},
                 {1023, "1023bytes"},
                 {1024, "1KB"},
                 {1536, "1KB,512bytes"},
                 {1610612739, "1GB,512MB,3bytes"},
                 {uint64_t{1} << 60, "1EB"},
                 {(uint64_t{1} << 50) + 1024, "1PB,1KB"},
                 {UINT64_MAX, "15EB,1023PB,1023TB,1023GB,1023MB,1023KB,1023bytes"}};
    for (const auto &c : cases)
        EXPECT_EQ(FormatSize(c.bytes), c.text);
}

using StringCopyTest = LibraryTest;

TEST_F(StringCopyTest, FillsAFieldToItsLastByteAndNoFurther)
{
    std::string field(9, '#');
    EXPECT_EQ(StringCopy(field.data(), 8, "%n%s567"), 0);
    EXPECT_EQ(field, std::string("%n%s567\0#", 9));
    EXPECT_EQ(StringCopy(field.data(), 8, 12345678), 18990025) << "anything that streams";
    EXPECT_EQ(field, std::string("1234567\0#", 9));
    EXPECT_EQ(StringCopy(static_cast<char *>(nullptr), 8, "x"), 18990003);
    EXPECT_EQ(logged(), (Lines{"StringCopy: Failed to copy string: 12345678", "StringCopy: NULL destination pointer"}));
}

using LogLineTest = LibraryTest;

TEST_F(LogLineTest, HeadNamesTheFailingStep)
{
    _tag_iscsi_lun_ record{};
    EXPECT_EQ(ISCSI::ISCSILUNInfo().loadFromConfig(record, 1), 18990530) << "quiet or not";
    const auto lines = fake::logLines();
    ASSERT_EQ(lines.size(), 1u);
    char file[64], method[64];
    int number = 0, end = 0;
    ASSERT_EQ(sscanf(lines[0].text.c_str(), "%63[^:]:%d:%63s No LUN UUID%n", file, &number, method, &end), 3);
    EXPECT_EQ(lines[0].text.size(), static_cast<size_t>(end));
    EXPECT_STREQ(file, "etc/ISCSILUNInfo.cpp");
    EXPECT_STREQ(method, "loadFromConfig");

    std::ifstream source(std::string(ISCSIWEBAPI_SOURCE_DIR "/") + file);
    std::string step;
    while (number-- > 0)
        std::getline(source, step);
    EXPECT_NE(step.find("No LUN UUID"), std::string::npos) << step;
}

} // namespace
} // namespace unit
