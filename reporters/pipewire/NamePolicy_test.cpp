#include "reporters/pipewire/NamePolicy.h"
#include "reporters/pipewire/Sha256.h"

#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

TEST(Sha256Test, HashesTheStandardsExamples) {
    EXPECT_EQ(sha256(""), "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
    EXPECT_EQ(sha256("abc"), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
    EXPECT_EQ(sha256("abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq"),
              "248d6a61d20638b8e5c026930c3e6039a33ce45964ff2167f6ecedd419db06c1");
    EXPECT_EQ(sha256(std::string(1000000, 'a')), "cdc76e5c9914fb9281a1c7e284d73e67f1809a48a497200e046d39ccc7112cd0");
}

TEST(Sha256Test, PadsAroundTheBlocksEnd) {
    EXPECT_EQ(sha256(std::string(55, 'a')), "9f4390f8d30c2dd92ec9f095b65e2b9ae9b0a925a5258e241c9f1e910f734318");
    EXPECT_EQ(sha256(std::string(56, 'a')), "b35439a4ac6f0948b6d6f9e3c6af0f5f590ce20f1bde7090ef7970686ec6738a");
    EXPECT_EQ(sha256(std::string(64, 'a')), "ffe054fe7ae0cb6dc65c3af9b61d5209f439851db43d0ba5997337df154668eb");
}

TEST(NamePolicyTest, NamesAreReportedAsTheyAre) {
    EXPECT_EQ(NamePolicy(NameTreatment::Report, "secret").apply("Player"), "Player");
}

TEST(NamePolicyTest, NamesAreLeftOut) {
    EXPECT_EQ(NamePolicy(NameTreatment::Omit, "secret").apply("Player"), std::nullopt);
}

TEST(NamePolicyTest, HashesTellNamesApartAndNothingElse) {
    const NamePolicy policy(NameTreatment::Hash, "secret");
    const std::string player = policy.apply("Player").value_or("");
    EXPECT_EQ(player.size(), 20);
    EXPECT_TRUE(player.starts_with("app-"));
    EXPECT_EQ(policy.apply("Player"), player);
    EXPECT_NE(policy.apply("Browser"), player);
}

TEST(NamePolicyTest, HashesDifferBetweenDevices) {
    EXPECT_NE(NamePolicy(NameTreatment::Hash, "one").apply("Player"),
              NamePolicy(NameTreatment::Hash, "other").apply("Player"));
}

TEST(NamePolicyTest, NamesThatCannotBeHashedSecretlyAreLeftOut) {
    EXPECT_EQ(NamePolicy(NameTreatment::Hash, "").apply("Player"), std::nullopt);
    EXPECT_EQ(NamePolicy(NameTreatment::Report, "").apply("Player"), "Player");
}

TEST(DeviceSecretTest, IsTheMachinesID) {
    EXPECT_EQ(deviceSecretOf("0123456789abcdef0123456789ABCDEF\n"), "0123456789abcdef0123456789ABCDEF\n");
    EXPECT_EQ(deviceSecretOf("0123456789abcdef0123456789ABCDEF"), "0123456789abcdef0123456789ABCDEF");
}

TEST(DeviceSecretTest, WhatIsNoIDIsNoSecret) {
    for (const char* const text : {"", "\n", "uninitialized\n", "00000000000000000000000000000000\n",
                                   "0123456789abcdef0123456789abcde\n", "0123456789abcdef0123456789abcdef0\n",
                                   "0123456789abcdef0123456789abcdeg\n", "0123456789abcdef0123456789abcdef\n\n"}) {
        EXPECT_EQ(deviceSecretOf(text), "") << text;
    }
}

} // namespace
} // namespace vela::reporter
