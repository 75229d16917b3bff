// The fake itself: what the other tests, and children that they fork, rely on.
#include "platform/schedule.h"
#include "tests/unit/Library.h"

#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

namespace unit {
namespace {

using FakePlatform = LibraryTest;

TEST_F(FakePlatform, TheNthCallFailsAsTheScriptSays)
{
    addLUN(3, "vol1");
    bool exists = false;
    NORViSCSILunIsNameExist("a", &exists);
    fake::failCall(2, 11);
    fake::failCall("NORViSCSILunIsNameExist", 2, 22);
    EXPECT_EQ(NORViSCSILunIsNameExist("vol1", &exists), 0);
    EXPECT_TRUE(exists);
    EXPECT_EQ(NORVSchedTaskRemove(7), 11);
    EXPECT_EQ(NORViSCSILunIsNameExist("b", &exists), 22);
    EXPECT_TRUE(exists) << "a failing call does nothing";
    EXPECT_EQ(NORViSCSILunIsNameExist("b", &exists), 0);

    fake::answer("NORViSCSILunTaskGetSchIDByName", {5, 6});
    for (long id : {5, 6, -1})
        EXPECT_EQ(NORViSCSILunTaskGetSchIDByName("vol1"), id);
}

TEST_F(FakePlatform, SeesWhatForkedChildrenDo)
{
    fake::failCall("NORVSchedTaskRemove", 2, 44);
    EXPECT_EQ(NORVSchedTaskRemove(1), -1);
    const pid_t child = fork();
    if (child == 0) {
        syslog(LOG_ERR, "etc/Failure.h:1:child slept %u", sleep(3600));
        _exit(NORVSchedTaskRemove(2)); // the second call, whoever makes it
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(WEXITSTATUS(status), 44);
    EXPECT_EQ(called(), (Lines{"NORVSchedTaskRemove(1)", "NORVSchedTaskRemove(2)"}));
    EXPECT_EQ(logged(), Lines{"child: slept 0"});
    EXPECT_EQ(fake::secondsSlept(), 3600u);
}

} // namespace
} // namespace unit
