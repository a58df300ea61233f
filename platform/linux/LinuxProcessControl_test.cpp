#include "platform/linux/LinuxProcessControl.h"

#include <cstdio>
#include <cstdlib>
#include <gtest/gtest.h>

namespace vela::platform {

namespace {

void sayGoodbye() { static_cast<void>(std::fputs("goodbye", stderr)); }

TEST(LinuxProcessControlDeathTest, TheProcessEndsWithTheStatusAndRunsNothingElse) {
    EXPECT_EXIT(
        {
            static_cast<void>(std::atexit(sayGoodbye));
            LinuxProcessControl().exitWithStatus(7);
        },
        ::testing::ExitedWithCode(7), "^$");
}

} // namespace

} // namespace vela::platform
