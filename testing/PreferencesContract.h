// What every Preferences does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `const Preferences& preferences()`, at first empty; `void set(domain, key, Value)` and `void
// remove(domain, key)`, by which somebody else changes the store.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/Preferences.h"

#include <gtest/gtest.h>
#include <string>

namespace vela::testing {

template <class Harness>
class PreferencesContract : public ::testing::Test {
protected:
    Value copyValue(std::string_view domain, std::string_view key) {
        return harness_.preferences().copyValue(domain, key);
    }

    Harness harness_;
};

TYPED_TEST_SUITE_P(PreferencesContract);

TYPED_TEST_P(PreferencesContract, AnEmptyStoreHasNoValues) {
    EXPECT_EQ(this->copyValue("com.orvex.audio", "enabled"), Value());
}

TYPED_TEST_P(PreferencesContract, AValueIsFoundByDomainAndKey) {
    this->harness_.set("com.orvex.audio", "enabled", true);
    this->harness_.set("com.orvex.audio", "name", "Desk");
    this->harness_.set("com.orvex.lobby", "enabled", false);
    EXPECT_EQ(this->copyValue("com.orvex.audio", "enabled"), Value(true));
    EXPECT_EQ(this->copyValue("com.orvex.audio", "name"), Value("Desk"));
    EXPECT_EQ(this->copyValue("com.orvex.lobby", "enabled"), Value(false));
    EXPECT_EQ(this->copyValue("com.orvex.lobby", "name"), Value());
    EXPECT_EQ(this->copyValue("com.orvex", "enabled"), Value());
}

TYPED_TEST_P(PreferencesContract, EveryKindOfValueIsKept) {
    const Dictionary value{{"boolean", true},
                           {"integer", -7},
                           {"real", 0.5},
                           {"text", "\xC3\xA9"},
                           {"data", Data("\x01\x02")},
                           {"date", Date{1'700'000'000}},
                           {"list", Array{1, "two"}},
                           {"nested", Dictionary{{"a", 1}}}};
    this->harness_.set("com.orvex.audio", "all", value);
    EXPECT_EQ(this->copyValue("com.orvex.audio", "all"), Value(value));
}

TYPED_TEST_P(PreferencesContract, AChangeIsSeenAtTheNextRead) {
    this->harness_.set("com.orvex.audio", "level", 1);
    EXPECT_EQ(this->copyValue("com.orvex.audio", "level"), Value(1));
    this->harness_.set("com.orvex.audio", "level", 2);
    EXPECT_EQ(this->copyValue("com.orvex.audio", "level"), Value(2));
    this->harness_.remove("com.orvex.audio", "level");
    EXPECT_EQ(this->copyValue("com.orvex.audio", "level"), Value());
}

TYPED_TEST_P(PreferencesContract, NamesAreTakenByTheLetter) {
    this->harness_.set("com.orvex.audio", "Enabled", true);
    EXPECT_EQ(this->copyValue("com.orvex.audio", "enabled"), Value());
    EXPECT_EQ(this->copyValue("com.orvex.Audio", "Enabled"), Value());
    EXPECT_EQ(this->copyValue("com.orvex.audio ", "Enabled"), Value());
}

TYPED_TEST_P(PreferencesContract, EmptyNamesHaveNoValue) {
    this->harness_.set("com.orvex.audio", "enabled", true);
    EXPECT_EQ(this->copyValue("", "enabled"), Value());
    EXPECT_EQ(this->copyValue("com.orvex.audio", ""), Value());
}

REGISTER_TYPED_TEST_SUITE_P(PreferencesContract, AnEmptyStoreHasNoValues, AValueIsFoundByDomainAndKey,
                            EveryKindOfValueIsKept, AChangeIsSeenAtTheNextRead, NamesAreTakenByTheLetter,
                            EmptyNamesHaveNoValue);

} // namespace vela::testing
