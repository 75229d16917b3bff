#include "host/target/Masking.h"
#include "host/target/Name.h"

#include <gtest/gtest.h>

namespace norvhost {
namespace {

TEST(IscsiName, IsLowerCaseAndOfAKnownForm)
{
    std::string normal;
    EXPECT_TRUE(normaliseName("iqn.1991-05.com.Microsoft:WIN-1", normal));
    EXPECT_EQ(normal, "iqn.1991-05.com.microsoft:win-1");
    EXPECT_TRUE(normaliseName("eui.02004567A425678D", normal));
    EXPECT_TRUE(normaliseName("naa.52004567BA64678D52004567ba64678d", normal));
    EXPECT_TRUE(normaliseName("iqn.2026-01.example:my_host", normal));
    EXPECT_FALSE(normaliseTargetName("iqn.2026-01.example:my_host", normal));
    normal = "untouched";
    for (const char *bad :
         {"", "iqn.", "iqn.2026-00.example", "iqn.2026-1.example", "iqn.2026-01.", "iqn.2026-01..x", "iqn.2026-01.x.:y",
          "iqn.2026-01.example:a\n", "iqn.2026-01.example:a,b=c", "eui.0200", "iqn.2026-13.example",
          "iqn.2026-01.example:a b", "naa.5200", "disk", "iqn.2026-01.example:\xc3\xa4"})
        EXPECT_FALSE(normaliseName(bad, normal)) << bad;
    EXPECT_FALSE(normaliseName(std::string_view("iqn.2026-01.example\0x", 21), normal));
    EXPECT_EQ(normal, "untouched");
}

TEST(Masking, ANamedEntryWinsOverTheDefault)
{
    Masking masking;
    EXPECT_EQ(masking.of("iqn.2026-01.example:x"), 0);
    masking.named = {{"iqn.2026-01.example:a", 3}, {"iqn.2026-01.example:b", 0}};
    masking.others = 3;
    EXPECT_EQ(masking.of("iqn.2026-01.example:B"), 0);
    EXPECT_EQ(masking.of("iqn.2026-01.example:x"), 3);
    EXPECT_EQ(masking.of("no name"), 0) << "nor does what is no name get the default";
    EXPECT_FALSE(masking.isOpen(3));
    EXPECT_TRUE(masking.gives(3));
    EXPECT_FALSE(masking.gives(1));
    masking.named.erase("iqn.2026-01.example:b");
    EXPECT_TRUE(masking.isOpen(3));
}

} // namespace
} // namespace norvhost
