#include "platform/spoor/TracePaths.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::spoor {
namespace {

using ::testing::ElementsAre;

TEST(TracePathsTest, EverythingStandsBelowTheRuntimeFolder) {
    EXPECT_EQ(traceFolder("/run/vela"), "/run/vela/trace");
    EXPECT_EQ(controlFile("/run/vela"), "/run/vela/trace/control");
    EXPECT_EQ(ringFolder("/run/vela"), "/run/vela/trace/rings");
}

TEST(TracePathsTest, TheUsersFolderComesBeforeTheSystems) {
    EXPECT_THAT(emitterFolders({"", "/run/user/7"}),
                ElementsAre(EmitterFolder{"/run/user/7/vela", false}, EmitterFolder{"/run/vela", true}));
}

TEST(TracePathsTest, WithoutAUsersFolderThereIsTheSystems) {
    EXPECT_THAT(emitterFolders({"", ""}), ElementsAre(EmitterFolder{"/run/vela", true}));
}

TEST(TracePathsTest, AFolderThatIsNamedIsTheOnlyOne) {
    EXPECT_THAT(emitterFolders({"/tmp/vela", "/run/user/7"}), ElementsAre(EmitterFolder{"/tmp/vela", true}));
}

} // namespace
} // namespace vela::platform::spoor
