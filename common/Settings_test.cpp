#include "common/Settings.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Kind = SettingOrigin::Kind;
using List = std::vector<std::string>;

RawSetting fromFile(std::string section, std::string key, SettingValue value, int line = 1) {
    return {std::move(section), std::move(key), std::move(value), {Kind::File, "/etc/v.toml", line}};
}

RawSetting fromCommandLine(std::string section, std::string key, SettingValue value) {
    return {std::move(section), std::move(key), std::move(value), {Kind::CommandLine, "", 0}};
}

SettingsReading merge(const std::vector<RawSetting>& given, const SettingsEnvironment& environment = {}) {
    return mergeSettings(given, environment);
}

std::vector<std::string> faultsOf(const std::vector<RawSetting>& given, const SettingsEnvironment& environment = {}) {
    std::vector<std::string> texts;
    for (const SettingError& error : merge(given, environment).errors) {
        texts.push_back(error.text());
    }
    return texts;
}

const SettingInForce* find(const SettingsReading& reading, std::string_view section, std::string_view key) {
    for (const SettingInForce& setting : reading.inForce) {
        if (setting.section == section && setting.key == key) {
            return &setting;
        }
    }
    return nullptr;
}

TEST(SettingsTest, NothingGivenIsTheDefaults) {
    const SettingsReading reading = merge({});
    ASSERT_TRUE(reading.settings.has_value());
    const Settings& settings = *reading.settings;
    EXPECT_FALSE(settings.device.internalBuild);
    EXPECT_EQ(settings.features, (std::map<std::string, bool, std::less<>>{{"AudioAnalytics/Tracing", false}}));
    EXPECT_EQ(settings.paths.root, "/");
    EXPECT_EQ(settings.paths.state, "/var/lib/vela");
    EXPECT_EQ(settings.paths.runtime, "/run/vela");
    EXPECT_EQ(settings.log.target, LogTarget::Journal);
    EXPECT_EQ(settings.log.level, platform::LogLevel::Default);
    EXPECT_EQ(settings.store.path, "/var/lib/vela/deliveries.db");
    EXPECT_EQ(settings.store.maxBytes, 268435456U);
    EXPECT_EQ(settings.store.commitMessages, 64U);
    EXPECT_EQ(settings.store.commitDelay, std::chrono::milliseconds(250));
    EXPECT_EQ(settings.beacon.backends, List{"store"});
    EXPECT_EQ(settings.tally.used, List{"*"});
    EXPECT_EQ(settings.drivers.tarn, (List{"channels", "cpuidle", "devfreq", "runtime-pm"}));
    EXPECT_EQ(settings.drivers.speaker, List{"channels"});
    EXPECT_EQ(settings.drivers.mca, List{"channels"});
    EXPECT_EQ(settings.drivers.haptics, (List{"channels", "force-feedback"}));
    EXPECT_EQ(settings.drivers.stateTransitionTimes, List{"channels"});
    EXPECT_EQ(settings.drivers.rx, (List{"channels", "alsa-capture"}));
    EXPECT_EQ(settings.drivers.tx, (List{"channels", "alsa-playback"}));
    EXPECT_EQ(settings.drivers.brook, List{"channels"});
    EXPECT_EQ(settings.access.users, List{});
    EXPECT_EQ(settings.access.groups, List{"audio"});
    EXPECT_EQ(settings.limits.messageBytes, 1048576U);
    EXPECT_EQ(settings.limits.valueDepth, 32U);
    EXPECT_EQ(settings.limits.sessionsPerClient, 1024U);
    EXPECT_EQ(settings.limits.clientsPerUser, 256U);
    EXPECT_EQ(settings.limits.sessionBytes, 67108864U);
    EXPECT_EQ(settings.limits.totalBytes, 536870912U);
    EXPECT_EQ(settings.limits.unsentReplies, 4194304U);
}

TEST(SettingsTest, EverySettingCanBeSet) {
    const SettingsReading reading = merge({
        fromFile("device", "InternalBuild", true),
        fromFile("features", "AudioAnalytics/Tracing", true),
        fromFile("paths", "root", "/r"),
        fromFile("paths", "state", "/s"),
        fromFile("paths", "runtime", "/t"),
        fromFile("log", "target", "stderr"),
        fromFile("log", "level", "error"),
        fromFile("store", "path", "/d.db"),
        fromFile("store", "max_bytes", "2 MiB"),
        fromFile("store", "commit_messages", std::int64_t{1}),
        fromFile("store", "commit_ms", std::int64_t{2}),
        fromFile("beacon", "backends", List{}),
        fromFile("tally", "used", List{"a", "b"}),
        fromFile("access", "users", List{"u"}),
        fromFile("access", "groups", List{"g"}),
        fromFile("drivers", "Tarn", List{"cpuidle"}),
        fromFile("drivers", "Speaker", List{"alsa-playback"}),
        fromFile("drivers", "MCA", List{"alsa-capture"}),
        fromFile("drivers", "Haptics", List{"force-feedback"}),
        fromFile("drivers", "StateTransitionTimes_ms", List{}),
        fromFile("drivers", "Rx", List{"devfreq"}),
        fromFile("drivers", "Tx", List{"runtime-pm"}),
        fromFile("drivers", "Brook", List{"channels", "cpuidle"}),
        fromFile("limits", "message_bytes", "1 KiB"),
        fromFile("limits", "value_depth", std::int64_t{3}),
        fromFile("limits", "sessions_per_client", std::int64_t{4}),
        fromFile("limits", "clients_per_user", std::int64_t{5}),
        fromFile("limits", "session_bytes", "2 KiB"),
        fromFile("limits", "total_bytes", "3 KiB"),
        fromFile("limits", "unsent_replies", "4 KiB"),
    });
    ASSERT_TRUE(reading.settings.has_value());
    const Settings& settings = *reading.settings;
    EXPECT_TRUE(settings.device.internalBuild);
    EXPECT_TRUE(settings.featureEnabled("AudioAnalytics", "Tracing"));
    EXPECT_EQ(settings.paths.root, "/r");
    EXPECT_EQ(settings.paths.state, "/s");
    EXPECT_EQ(settings.paths.runtime, "/t");
    EXPECT_EQ(settings.log.target, LogTarget::StandardError);
    EXPECT_EQ(settings.log.level, platform::LogLevel::Error);
    EXPECT_EQ(settings.store.path, "/d.db");
    EXPECT_EQ(settings.store.maxBytes, 2097152U);
    EXPECT_EQ(settings.store.commitMessages, 1U);
    EXPECT_EQ(settings.store.commitDelay, std::chrono::milliseconds(2));
    EXPECT_EQ(settings.beacon.backends, List{});
    EXPECT_EQ(settings.tally.used, (List{"a", "b"}));
    EXPECT_EQ(settings.access.users, List{"u"});
    EXPECT_EQ(settings.access.groups, List{"g"});
    EXPECT_EQ(settings.drivers.tarn, List{"cpuidle"});
    EXPECT_EQ(settings.drivers.speaker, List{"alsa-playback"});
    EXPECT_EQ(settings.drivers.mca, List{"alsa-capture"});
    EXPECT_EQ(settings.drivers.haptics, List{"force-feedback"});
    EXPECT_EQ(settings.drivers.stateTransitionTimes, List{});
    EXPECT_EQ(settings.drivers.rx, List{"devfreq"});
    EXPECT_EQ(settings.drivers.tx, List{"runtime-pm"});
    EXPECT_EQ(settings.drivers.brook, (List{"channels", "cpuidle"}));
    EXPECT_EQ(settings.limits.messageBytes, 1024U);
    EXPECT_EQ(settings.limits.valueDepth, 3U);
    EXPECT_EQ(settings.limits.sessionsPerClient, 4U);
    EXPECT_EQ(settings.limits.clientsPerUser, 5U);
    EXPECT_EQ(settings.limits.sessionBytes, 2048U);
    EXPECT_EQ(settings.limits.totalBytes, 3072U);
    EXPECT_EQ(settings.limits.unsentReplies, 4096U);
    for (const SettingInForce& setting : reading.inForce) {
        EXPECT_EQ(setting.origin.kind, Kind::File) << setting.key;
    }
}

TEST(SettingsTest, EachLogLevelIsItsOwn) {
    for (const auto& [text, level] : {std::pair{"debug", platform::LogLevel::Debug},
                                      {"info", platform::LogLevel::Info},
                                      {"default", platform::LogLevel::Default},
                                      {"error", platform::LogLevel::Error}}) {
        EXPECT_EQ(merge({fromFile("log", "level", text)}).settings->log.level, level) << text;
    }
}

TEST(SettingsTest, TheLastLayerWins) {
    const SettingsReading reading =
        merge({fromFile("log", "level", "debug", 3), fromCommandLine("log", "level", "info"),
               fromCommandLine("log", "level", "error")});
    ASSERT_TRUE(reading.settings.has_value());
    EXPECT_EQ(reading.settings->log.level, platform::LogLevel::Error);
    EXPECT_EQ(find(reading, "log", "level")->origin, (SettingOrigin{Kind::CommandLine, "", 0}));
}

TEST(SettingsTest, EachSettingKnowsWhereItComesFrom) {
    const SettingsReading reading =
        merge({fromFile("log", "level", "debug", 12), fromCommandLine("log", "target", "stderr")});
    EXPECT_EQ(find(reading, "log", "level")->origin.text(), "/etc/v.toml:12");
    EXPECT_EQ(find(reading, "log", "target")->origin.text(), "--set");
    EXPECT_EQ(find(reading, "paths", "root")->origin.text(), "default");
}

TEST(SettingsTest, TheListingShowsCheckedValues) {
    const SettingsReading reading = merge({fromFile("limits", "message_bytes", std::int64_t{2048})});
    EXPECT_EQ(find(reading, "limits", "message_bytes")->text, "\"2 KiB\"");
    EXPECT_EQ(find(reading, "limits", "message_bytes")->value, SettingValue(std::int64_t{2048}));
    EXPECT_EQ(find(reading, "store", "path")->text, "\"/var/lib/vela/deliveries.db\"");
    EXPECT_EQ(find(reading, "access", "groups")->text, "[\"audio\"]");
}

TEST(SettingsTest, AFaultThatALaterLayerReplacesIsStillReported) {
    EXPECT_THAT(faultsOf({fromFile("log", "level", "loud", 2), fromCommandLine("log", "level", "info")}),
                ElementsAre("/etc/v.toml:2: log.level: \"loud\" is none of debug, info, default, error"));
}

TEST(SettingsTest, AllFaultsAreReported) {
    EXPECT_THAT(faultsOf({fromFile("log", "level", "loud", 2), fromFile("log", "levle", "info", 3),
                          fromFile("limits", "value_depth", std::int64_t{0}, 5), fromFile("store", "path", "x", 6),
                          fromCommandLine("device", "InternalBuild", "yes")}),
                ElementsAre("/etc/v.toml:2: log.level: \"loud\" is none of debug, info, default, error",
                            "/etc/v.toml:3: log.levle: there is no such setting; did you mean log.level?",
                            "/etc/v.toml:5: limits.value_depth: 0 is outside 1 to 128",
                            "--set: device.InternalBuild: \"yes\" is not true or false",
                            "/etc/v.toml:6: store.path: \"x\" is no absolute path and begins with neither <state> nor "
                            "<runtime>"));
}

TEST(SettingsTest, WithFaultsThereAreNoSettings) {
    const SettingsReading reading = merge({fromFile("log", "level", "loud")});
    EXPECT_FALSE(reading.settings.has_value());
    EXPECT_THAT(reading.inForce, IsEmpty());
}

TEST(SettingsTest, MoreThanAHundredFaultsAreCounted) {
    std::vector<RawSetting> given;
    for (int line = 1; line <= 105; ++line) {
        given.push_back(fromFile("log", "no_such_thing_at_all", true, line));
    }
    const std::vector<std::string> faults = faultsOf(given);
    ASSERT_EQ(faults.size(), 101U);
    EXPECT_EQ(faults[99], "/etc/v.toml:100: log.no_such_thing_at_all: there is no such setting");
    EXPECT_EQ(faults[100], "and 5 more");
}

TEST(SettingsTest, AnUnknownSectionIsReportedOnceAndNotItsKeys) {
    EXPECT_THAT(faultsOf({fromFile("lmits", "", {}, 4), fromFile("lmits", "value_depth", std::int64_t{1}, 5),
                          fromFile("lmits", "x", true, 6)}),
                ElementsAre("/etc/v.toml:4: lmits: there is no such section; did you mean limits?"));
}

TEST(SettingsTest, AnUnknownSectionWithoutKeysIsReported) {
    EXPECT_THAT(faultsOf({fromFile("utterly", "", {}, 4)}),
                ElementsAre("/etc/v.toml:4: utterly: there is no such section"));
}

TEST(SettingsTest, AnEmptyKnownSectionIsFine) {
    EXPECT_TRUE(merge({fromFile("limits", "", {}, 4)}).settings.has_value());
}

TEST(SettingsTest, AnEmptyKeyIsAnUnknownSetting) {
    EXPECT_THAT(faultsOf({fromFile("limits", "", true, 4)}),
                ElementsAre("/etc/v.toml:4: limits.: there is no such setting"));
}

TEST(SettingsTest, TheDeviceHasNoOtherProperties) {
    EXPECT_THAT(faultsOf({fromFile("device", "internalbuild", true)}),
                ElementsAre("/etc/v.toml:1: device.internalbuild: there is no such setting; did you mean "
                            "device.InternalBuild?"));
}

TEST(SettingsTest, NamesFromOutsideCannotBreakALine) {
    EXPECT_THAT(faultsOf({fromFile("log", "a\nb\x1b", true)}),
                ElementsAre("/etc/v.toml:1: log.a\\nb\\u001b: there is no such setting"));
}

TEST(SettingsTest, FurtherFeaturesAreTaken) {
    const SettingsReading reading = merge({fromFile("features", "Some.Domain/Flag", true, 7)});
    ASSERT_TRUE(reading.settings.has_value());
    EXPECT_TRUE(reading.settings->featureEnabled("Some.Domain", "Flag"));
    EXPECT_FALSE(reading.settings->featureEnabled("AudioAnalytics", "Tracing"));
    EXPECT_FALSE(reading.settings->featureEnabled("Nobody", "Knows"));
    EXPECT_EQ(reading.inForce.back().key, "Some.Domain/Flag");
    EXPECT_EQ(reading.inForce.back().text, "true");
    EXPECT_EQ(reading.inForce.back().origin.text(), "/etc/v.toml:7");
}

TEST(SettingsTest, AFeatureHasADomainAndAName) {
    for (const char* key : {"Tracing", "/Tracing", "Domain/", "/"}) {
        EXPECT_THAT(faultsOf({fromFile("features", key, true)}),
                    ElementsAre("/etc/v.toml:1: features." + std::string(key) + ": a feature is named \"Domain/Name\""))
            << key;
    }
}

TEST(SettingsTest, AFeatureIsABoolean) {
    EXPECT_THAT(faultsOf({fromFile("features", "A/B", std::int64_t{1})}),
                ElementsAre("/etc/v.toml:1: features.A/B: 1 is not true or false"));
    EXPECT_THAT(faultsOf({fromFile("features", "AudioAnalytics/Tracing", "on")}),
                ElementsAre("/etc/v.toml:1: features.AudioAnalytics/Tracing: \"on\" is not true or false"));
}

TEST(SettingsTest, PathsBeginWithTheFoldersInForce) {
    const SettingsReading reading =
        merge({fromFile("paths", "state", "/s"), fromFile("paths", "runtime", "/t"),
               fromFile("paths", "root", "<runtime>/root"), fromCommandLine("store", "path", "<state>/x/y.db")});
    ASSERT_TRUE(reading.settings.has_value());
    EXPECT_EQ(reading.settings->paths.root, "/t/root");
    EXPECT_EQ(reading.settings->store.path, "/s/x/y.db");
}

TEST(SettingsTest, ThePlaceholdersStandForNothingInTheirOwnFolders) {
    EXPECT_THAT(faultsOf({fromFile("paths", "state", "<runtime>/s")}),
                ElementsAre("/etc/v.toml:1: paths.state: \"<runtime>/s\" is no absolute path"));
    EXPECT_THAT(faultsOf({fromFile("paths", "runtime", "<runtime>/s")}),
                ElementsAre("/etc/v.toml:1: paths.runtime: \"<runtime>/s\" is no absolute path"));
}

TEST(SettingsTest, ARelativePathIsRefused) {
    EXPECT_THAT(faultsOf({fromFile("paths", "root", "x")}),
                ElementsAre("/etc/v.toml:1: paths.root: \"x\" is no absolute path and begins with neither <state> nor "
                            "<runtime>"));
    EXPECT_THAT(faultsOf({fromFile("store", "path", "<stat>/x")}),
                ElementsAre("/etc/v.toml:1: store.path: \"<stat>/x\" is no absolute path and begins with neither "
                            "<state> nor <runtime>"));
}

TEST(SettingsTest, TheSocketsAddressMustFit) {
    EXPECT_TRUE(merge({fromFile("paths", "runtime", "/" + std::string(74, 'r'))}).settings.has_value());
    EXPECT_THAT(faultsOf({fromFile("paths", "runtime", "/" + std::string(75, 'r'))}),
                ElementsAre("/etc/v.toml:1: paths.runtime: \"/" + std::string(75, 'r') +
                            "\" is too long for a socket's address: at most 75 bytes"));
}

TEST(SettingsTest, AnOrdinaryUsersFoldersAreBelowItsOwn) {
    const SettingsReading reading = merge({}, {true, "/run/user/7", "/home/u/state", "/home/u"});
    ASSERT_TRUE(reading.settings.has_value());
    EXPECT_EQ(reading.settings->paths.runtime, "/run/user/7/vela");
    EXPECT_EQ(reading.settings->paths.state, "/home/u/state/vela");
    EXPECT_EQ(reading.settings->store.path, "/home/u/state/vela/deliveries.db");
    EXPECT_EQ(find(reading, "paths", "state")->origin.kind, Kind::Default);
}

TEST(SettingsTest, WithoutAStateFolderAnOrdinaryUsersHomeIsTaken) {
    const SettingsReading reading = merge({}, {true, "/run/user/7", "", "/home/u"});
    ASSERT_TRUE(reading.settings.has_value());
    EXPECT_EQ(reading.settings->paths.state, "/home/u/.local/state/vela");
}

TEST(SettingsTest, RelativeFoldersOfTheEnvironmentDoNotCount) {
    EXPECT_EQ(merge({}, {true, "/run/user/7", "state", "/home/u"}).settings->paths.state, "/home/u/.local/state/vela");
    EXPECT_THAT(faultsOf({}, {true, "run", "/s", ""}),
                ElementsAre("paths.runtime: has no default, because XDG_RUNTIME_DIR names no folder: set it"));
}

TEST(SettingsTest, AnOrdinaryUserWithoutFoldersMustSetThem) {
    EXPECT_THAT(
        faultsOf({}, {true, "", "", ""}),
        ElementsAre("paths.state: has no default, because neither XDG_STATE_HOME nor HOME names a folder: set it",
                    "paths.runtime: has no default, because XDG_RUNTIME_DIR names no folder: set it"));
    EXPECT_TRUE(merge({fromFile("paths", "state", "/s"), fromFile("paths", "runtime", "/r")}, {true, "", "", ""})
                    .settings.has_value());
}

TEST(SettingsTest, TheFileWinsOverAnOrdinaryUsersFolders) {
    EXPECT_EQ(merge({fromFile("paths", "state", "/s")}, {true, "/run/user/7", "/x", "/y"}).settings->paths.state, "/s");
}

TEST(SettingsTest, RootsFoldersDoNotDependOnTheEnvironment) {
    EXPECT_EQ(merge({}, {false, "/run/user/0", "/x", "/root"}).settings->paths.runtime, "/run/vela");
}

TEST(SettingsTest, AMessageFitsIntoItsSession) {
    EXPECT_THAT(faultsOf({fromFile("limits", "message_bytes", "65 MiB", 9)}),
                ElementsAre("/etc/v.toml:9: limits.message_bytes: 65 MiB is more than limits.session_bytes (64 MiB, "
                            "default)"));
    EXPECT_TRUE(merge({fromFile("limits", "message_bytes", "64 MiB")}).settings.has_value());
}

TEST(SettingsTest, TheLargerOfTwoSizesIsBlamedWhenOnlyItWasWritten) {
    EXPECT_THAT(faultsOf({fromFile("limits", "session_bytes", "512 KiB", 3)}),
                ElementsAre("/etc/v.toml:3: limits.session_bytes: 512 KiB is less than limits.message_bytes (1 MiB, "
                            "default)"));
}

TEST(SettingsTest, BothPlacesOfAContradictionAreNamed) {
    EXPECT_THAT(
        faultsOf({fromFile("limits", "session_bytes", "2 GiB", 3), fromCommandLine("limits", "total_bytes", "1 GiB")}),
        ElementsAre("/etc/v.toml:3: limits.session_bytes: 2 GiB is more than limits.total_bytes (1 GiB, --set)"));
}

TEST(SettingsTest, AMessageFitsIntoTheStore) {
    EXPECT_THAT(faultsOf({fromFile("limits", "message_bytes", "2 MiB", 3), fromFile("store", "max_bytes", "1 MiB", 5)}),
                ElementsAre("/etc/v.toml:3: limits.message_bytes: 2 MiB is more than store.max_bytes (1 MiB, "
                            "/etc/v.toml:5)"));
}

TEST(SettingsTest, ASizeThatWasRefusedContradictsNothing) {
    EXPECT_THAT(
        faultsOf({fromFile("limits", "message_bytes", "5 MB", 3), fromFile("limits", "session_bytes", "8 KiB", 4)}),
        ElementsAre("/etc/v.toml:3: limits.message_bytes: \"5 MB\" has no known unit (B, KiB, MiB, GiB, TiB)"));
}

TEST(SettingErrorTest, EveryPartIsShownWhenItIsThere) {
    EXPECT_EQ((SettingError{"f.toml", 3, 7, "log.level", "bad"}.text()), "f.toml:3:7: log.level: bad");
    EXPECT_EQ((SettingError{"f.toml", 0, 0, "", "bad"}.text()), "f.toml: bad");
    EXPECT_EQ((SettingError{"", 0, 0, "log.level", "bad"}.text()), "log.level: bad");
    EXPECT_EQ((SettingError{"", 0, 0, "", "bad"}.text()), "bad");
    EXPECT_EQ((SettingError{"a\nb", 1, 0, "", "bad"}.text()), "a\\nb:1: bad");
}

TEST(SettingOriginTest, AFileWithoutALineIsNamedAlone) {
    EXPECT_EQ((SettingOrigin{Kind::File, "f.toml", 0}.text()), "f.toml");
}

} // namespace
} // namespace vela
