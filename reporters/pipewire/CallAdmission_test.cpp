#include "reporters/pipewire/CallAdmission.h"

#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

constexpr std::size_t kRoom = 99;
constexpr std::size_t kFull = 100;

Call create() {
    CreateCall call;
    call.session.reporterID = 7;
    return call;
}

class CallAdmissionTest : public ::testing::Test {
protected:
    CallAdmission admission{100};
    const Call start = StartCall{7};
    const Call send = SendCall{7, {}};
    const Call stop = StopCall{7};
    const Call destroy = DestroyCall{7};
};

TEST_F(CallAdmissionTest, TakesEverythingWhileThereIsRoom) {
    for (const Call& call : {create(), start, send, stop, destroy}) {
        EXPECT_TRUE(admission.admits(call, kRoom)) << call.index();
    }
}

TEST_F(CallAdmissionTest, TakesTheEndsOfWhatWasTakenInAnyCase) {
    admission.admits(create(), kRoom);
    admission.admits(start, kRoom);
    EXPECT_FALSE(admission.admits(send, kFull));
    EXPECT_TRUE(admission.admits(stop, kFull));
    EXPECT_TRUE(admission.admits(destroy, kFull));
}

TEST_F(CallAdmissionTest, ASessionThatWasNotCreatedIsMissingToItsEnd) {
    EXPECT_FALSE(admission.admits(create(), kFull));
    EXPECT_FALSE(admission.admits(start, kRoom));
    EXPECT_FALSE(admission.admits(send, kRoom));
    EXPECT_FALSE(admission.admits(stop, kRoom));
    EXPECT_FALSE(admission.admits(start, kFull));
    EXPECT_FALSE(admission.admits(stop, kFull));
    EXPECT_FALSE(admission.admits(send, kRoom)) << "a missing run does not hide that the session is";
    EXPECT_FALSE(admission.admits(destroy, kRoom));
    EXPECT_TRUE(admission.admits(create(), kRoom));
    EXPECT_TRUE(admission.admits(destroy, kRoom));
}

TEST_F(CallAdmissionTest, ARunThatWasNotStartedIsMissingToItsStop) {
    admission.admits(create(), kRoom);
    EXPECT_FALSE(admission.admits(start, kFull));
    EXPECT_FALSE(admission.admits(send, kRoom));
    EXPECT_FALSE(admission.admits(stop, kRoom));
    EXPECT_TRUE(admission.admits(send, kRoom));
    EXPECT_TRUE(admission.admits(start, kRoom));
    EXPECT_TRUE(admission.admits(stop, kFull));
    EXPECT_TRUE(admission.admits(destroy, kFull));
}

TEST_F(CallAdmissionTest, ASessionThatWasCreatedIsDestroyedWhateverItsRunsWere) {
    admission.admits(create(), kRoom);
    EXPECT_FALSE(admission.admits(start, kFull));
    EXPECT_TRUE(admission.admits(destroy, kFull));
    EXPECT_TRUE(admission.admits(create(), kRoom));
}

} // namespace
} // namespace vela::reporter
