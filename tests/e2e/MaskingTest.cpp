#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

namespace e2e {
namespace {

class MaskingTest : public Appliance {};

TEST_F(MaskingTest, AStrangerNeitherDiscoversNorLogsIn)
{
    const Store store = createStore();
    for (int port : {portal_port, rw_port, ro_port}) {
        EXPECT_TRUE(Initiator(mallory).discover(port).empty()) << port;
        EXPECT_FALSE(Initiator(mallory).logIn(store.target.iqn, port)) << port;
    }
    EXPECT_EQ(Initiator(alice).discover().count(store.target.iqn), 1u);
    EXPECT_TRUE(Initiator(alice).logIn(store.target.iqn));
}

TEST_F(MaskingTest, AReaderReadsAndNeverWrites)
{
    const Store store = createStore();
    Initiator writer(alice), reader(bob);
    ASSERT_TRUE(writer.logIn(store.target.iqn)) << writer.error();
    ASSERT_TRUE(reader.logIn(store.target.iqn)) << reader.error();
    EXPECT_EQ(writer.port(), rw_port);
    EXPECT_EQ(reader.port(), ro_port);
    EXPECT_TRUE(writer.write(0, 0xaa));
    EXPECT_TRUE(reader.holds(0, 0xaa)) << reader.error();
    EXPECT_FALSE(reader.write(0, 0x55));
    EXPECT_TRUE(writer.holds(0, 0xaa));
    EXPECT_EQ(writer.serial(), reader.serial());
    EXPECT_EQ(writer.identification(), reader.identification());
    EXPECT_FALSE(Initiator(bob).logIn(store.target.iqn, rw_port));
    EXPECT_TRUE(Initiator(bob).discover(rw_port).empty());
}

} // namespace
} // namespace e2e
