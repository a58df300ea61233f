// What a session leaves at its end: the summary event and, on internal builds, the file of its messages.
#include "session/Session_test.h"

#include <cerrno>
#include <limits>

namespace vela {

namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kDirectory = "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Reporting";
constexpr const char* kPath = "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Reporting/"
                              "20231114-221320+0000-vela-Unknown-haptics.json";

class VelaReportingSessionSummaryTest : public SessionTest {
protected:
    VelaReportingSession& startedSession() {
        session().setServiceType(3);
        return runningSession();
    }
    /// Seven; a piece of the file ends with every third.
    void sendLongMessages() {
        for (int number = 0; number < 7; ++number) {
            send({{"a", std::string_view(std::string(400'000, static_cast<char>('a' + number)))}});
        }
    }
    std::optional<Dictionary> summary() { return session().createSummaryEventForSession(); }
    std::optional<std::string> file() const { return fileSystem_.contentOf(kPath); }
};

// The event.

TEST_F(VelaReportingSessionSummaryTest, ThereIsNoneWithoutMessages) {
    session();
    EXPECT_EQ(summary(), std::nullopt);
    startedSession();
    EXPECT_EQ(summary(), std::nullopt);
    send({{"a", 1}});
    session().stop();
    EXPECT_EQ(summary(), std::nullopt);
}

TEST_F(VelaReportingSessionSummaryTest, GathersEveryKeyInOrder) {
    startedSession();
    send({{"a", 1}});
    send({{"a", 2}, {"b", "x"}}, 4, 2);
    send({{"a", 3}});
    ASSERT_TRUE(summary().has_value());
    EXPECT_EQ(*summary(), (Dictionary{{"VELA_Session_Summary_Event", "3"},
                                      {"a", "1,2,3"},
                                      {"audiotag", "GenericStart,PlaybackStop,GenericStart"},
                                      {"b", "x"}}));
    EXPECT_THAT(keysOf(*summary()), ElementsAre("VELA_Session_Summary_Event", "a", "audiotag", "b"));
}

TEST_F(VelaReportingSessionSummaryTest, EveryValueIsAString) {
    startedSession();
    send({{"a", 1}, {"b", true}, {"c", 0.5}});
    const Dictionary event = summary().value();
    for (const auto& entry : event) {
        EXPECT_EQ(entry.value.kind(), ValueKind::String) << entry.key.text();
    }
    EXPECT_EQ(event.find("b"), Value("1"));
    EXPECT_EQ(event.find("c"), Value("0.5"));
}

TEST_F(VelaReportingSessionSummaryTest, TheTypeOfAnUntypedSessionIs65535) {
    runningSession();
    send({{"a", 1}});
    EXPECT_EQ(summary()->find("VELA_Session_Summary_Event"), Value("65535"));
}

TEST_F(VelaReportingSessionSummaryTest, AMessagesKeyOfTheEventsNameIsAppended) {
    startedSession();
    send({{"a", 1}, {"VELA_Session_Summary_Event", "foo"}});
    EXPECT_EQ(summary()->find("VELA_Session_Summary_Event"), Value("3,foo"));
    EXPECT_THAT(keysOf(*summary()), ElementsAre("VELA_Session_Summary_Event", "a", "audiotag"));
}

TEST_F(VelaReportingSessionSummaryTest, AKeyOfSomeMessagesHasOnlyTheirValues) {
    startedSession();
    send({{"a", 1}});
    send({{"b", 1}});
    send({{"a", 2}});
    EXPECT_EQ(summary()->find("b"), Value("1"));
    EXPECT_EQ(summary()->find("a"), Value("1,2"));
}

TEST_F(VelaReportingSessionSummaryTest, EqualValuesRepeat) {
    startedSession();
    send({{"a", "x"}, {"b", 1}});
    send({{"a", "x"}, {"b", 2}});
    EXPECT_EQ(summary()->find("a"), Value("x,x"));
}

TEST_F(VelaReportingSessionSummaryTest, EmptyValuesKeepTheirPlace) {
    startedSession();
    send({{"a", ""}});
    send({{"a", "x"}});
    send({{"a", ""}});
    EXPECT_EQ(summary()->find("a"), Value(",x,"));
}

TEST_F(VelaReportingSessionSummaryTest, CommasInStringsStayAsTheyAre) {
    startedSession();
    send({{"a", "x, \"y\""}});
    send({{"a", "z"}});
    EXPECT_EQ(summary()->find("a"), Value("x, \"y\",z"));
}

TEST_F(VelaReportingSessionSummaryTest, ArraysAndDictionariesStandInTheirTextualForm) {
    startedSession();
    send({{"a", Array{1, "two words"}}});
    send({{"a", Dictionary{{"k", 1}}}});
    send({{"a", Data("\x0f\xbd")}});
    EXPECT_EQ(summary()->find("a"), Value("(1, \"two words\"),{k = 1;},<0fbd>"));
}

TEST_F(VelaReportingSessionSummaryTest, TimesAreGatheredOnEveryBuild) {
    startedSession();
    send({{"velareporting_timestamp", 1.5}, {"a", 1}});
    send({{"velareporting_timestamp", 2.5}, {"a", 2}});
    EXPECT_EQ(summary()->find("velareporting_timestamp"), Value("1.5,2.5"));
}

TEST_F(VelaReportingSessionSummaryTest, RedundantMessagesAreNotGathered) {
    startedSession();
    send({{"a", 1}});
    send({{"a", 1}});
    EXPECT_EQ(summary()->find("a"), Value("1"));
}

TEST_F(VelaReportingSessionSummaryTest, VolumeMessagesAreGathered) {
    startedSession();
    sendOnePlayback();
    session().stop();
    queues_.runUntilIdle();
    const Dictionary sent = sentPayloads().back();
    EXPECT_EQ(sent.find("play_secondsBucketed"), Value("10"));
    EXPECT_EQ(sent.find("NexoSessionVolume"), Value("0.5,0.5"));
}

TEST_F(VelaReportingSessionSummaryTest, AsSentItIsTaggedAndHasNoTime) {
    startedSession();
    send({{"velareporting_timestamp", 1.5}, {"a", 1}});
    session().stop();
    queues_.runUntilIdle();
    const auto sent = beacon_.callsOf(BeaconOperation::Send);
    ASSERT_EQ(sent.size(), 2U);
    EXPECT_EQ(sent[1].payload,
              (Dictionary{{"VELA_Session_Summary_Event", "3"}, {"a", "1"}, {"audiotag", "UndefinedUnknown"}}));
    EXPECT_EQ(sent[1].category, 65535);
    EXPECT_EQ(sent[1].type, 65535);
    EXPECT_THAT(log_.lines(), Contains(sessionLine(LogLevel::Default, "sending summary event for reporter 42")));
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 1U);
    EXPECT_THAT(analytics_.events, IsEmpty());
}

TEST_F(VelaReportingSessionSummaryTest, OnInternalBuildsItsTimesAreSent) {
    makeInternalBuild();
    startedSession();
    send({{"velareporting_timestamp", 1.5}});
    session().stop();
    queues_.runUntilIdle();
    EXPECT_EQ(sentPayloads().back().find("velareporting_timestamp"), Value("1.5"));
}

TEST_F(VelaReportingSessionSummaryTest, IsRecordedAndSentWhileTheSessionIsStillStarted) {
    startedSession();
    send({{"a", 1}});
    std::vector<std::string> keys;
    int traced = 0;
    spoor_.setObserver([&](std::uint32_t code) {
        if (code == 0x21044838) {
            EXPECT_TRUE(session().started());
            keys = recordedKeys();
            ++traced;
        }
    });
    session().stop();
    spoor_.setObserver(nullptr);
    EXPECT_EQ(traced, 1);
    EXPECT_THAT(keys, ElementsAre("Generic_Start_1", "Undefined_Unknown_1"));
    queues_.advance(std::chrono::seconds(2));
    EXPECT_THAT(beacon_.callsOf(BeaconOperation::SendOne), IsEmpty());
}

TEST_F(VelaReportingSessionSummaryTest, OnlyRepeatsOfOneMessageGiveFileAndSummary) {
    makeInternalBuild();
    startedSession();
    send({{"a", 1}});
    send({{"a", 1}});
    session().stop();
    EXPECT_EQ(fileSystem_.files().size(), 1U);
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 1U);
}

// The file.

TEST_F(VelaReportingSessionSummaryTest, OtherBuildsWriteAndLogNothing) {
    startedSession();
    send({{"a", 1}});
    session().writeSummaryJson();
    EXPECT_THAT(fileSystem_.files(), IsEmpty());
    EXPECT_EQ(fileSystem_.permissionsOf(kDirectory), std::nullopt);
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "sending message for session owned by 42")));
}

TEST_F(VelaReportingSessionSummaryTest, WithoutMessagesNothingIsWrittenOrLogged) {
    makeInternalBuild();
    session().writeSummaryJson();
    startedSession().writeSummaryJson();
    EXPECT_THAT(log_.lines(), IsEmpty());
    session().stop();
    EXPECT_THAT(fileSystem_.files(), IsEmpty());
    EXPECT_EQ(fileSystem_.permissionsOf(kDirectory), std::nullopt);
}

TEST_F(VelaReportingSessionSummaryTest, TheFileLetterByLetter) {
    makeInternalBuild();
    startedSession();
    send({{"velareporting_timestamp", 1.5}, {"a b", 1}, {"empty", Dictionary()}, {"list", Array{true, "x\"y"}}});
    send({{"nested", Dictionary{{"z", 1}, {"a", 2}}}}, 0x10000004, 2);
    session().writeSummaryJson();
    EXPECT_EQ(file(), R"([
  {
    "Generic_Start_1": {
      "velareporting_timestamp": 1.5,
      "a_b": 1,
      "empty": {},
      "list": [
        true,
        "x\"y"
      ],
      "audiotag": "GenericStart"
    }
  },
  {
    "DSP_Playback_Stop_1": {
      "nested": {
        "z": 1,
        "a": 2
      },
      "audiotag": "DSP_PlaybackStop"
    }
  }
])");
    EXPECT_EQ(fileSystem_.permissionsOf(kDirectory), 0777U);
    EXPECT_EQ(fileSystem_.permissionsOf(kPath), 0644U);
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, std::string("jsonOutput writeToURL: ") + kPath));
}

TEST_F(VelaReportingSessionSummaryTest, DataDatesAndWhatIsNoNumberDoNotFail) {
    makeInternalBuild();
    startedSession();
    send({{"data", Data("abc")},
          {"date", Date{1'700'000'000}},
          {"nan", std::numeric_limits<double>::quiet_NaN()},
          {"infinity", std::numeric_limits<double>::infinity()}});
    session().writeSummaryJson();
    EXPECT_EQ(file(), R"([
  {
    "Generic_Start_1": {
      "data": "YWJj",
      "date": "2023-11-14T22:13:20Z",
      "nan": null,
      "infinity": null,
      "audiotag": "GenericStart"
    }
  }
])");
}

TEST_F(VelaReportingSessionSummaryTest, TheFileHasTheVolumeMessagesButNotTheSummary) {
    makeInternalBuild();
    startedSession();
    sendOnePlayback();
    session().stop();
    const std::string text = file().value_or("");
    EXPECT_NE(text.find("\"Volume_Summary_1\": {"), std::string::npos);
    EXPECT_EQ(text.find("Undefined_Unknown"), std::string::npos);
}

TEST_F(VelaReportingSessionSummaryTest, TheFileIsWrittenBetweenVolumeAndSummary) {
    makeInternalBuild();
    startedSession();
    sendOnePlayback();
    log_.clear();
    session().stop();
    std::vector<std::string> steps;
    for (const CapturedLine& line : log_.lines()) {
        if (line.level == LogLevel::Default || line.level == LogLevel::Info) {
            steps.push_back(line.message);
        }
    }
    EXPECT_THAT(steps,
                ElementsAre("sending volume event for reporter 42", std::string("jsonOutput writeToURL: ") + kPath,
                            "sending summary event for reporter 42"));
}

TEST_F(VelaReportingSessionSummaryTest, TheNameHasLocalTimeOffsetApplicationAndService) {
    makeInternalBuild();
    clock_.setNow(platform::WallTime(std::chrono::seconds(1'706'692'530))); // 2024-01-31 09:15:30 UTC
    clock_.setLocalOffset(std::chrono::hours(1));
    startedSession().setConfiguration(Dictionary{{"HostApplicationDisplayID", "com.example.player"}});
    send({{"a", 1}});
    session().writeSummaryJson();
    EXPECT_THAT(fileSystem_.files(),
                ElementsAre(std::string(kDirectory) + "/20240131-101530+0100-vela-com.example.player-haptics.json"));
}

TEST_F(VelaReportingSessionSummaryTest, ServiceNamesInTheFilesName) {
    makeInternalBuild();
    runningSession();
    send({{"a", 1}});
    session().writeSummaryJson();
    session().setServiceType(14);
    session().writeSummaryJson();
    EXPECT_THAT(fileSystem_.files(),
                ElementsAre(std::string(kDirectory) + "/20231114-221320+0000-vela-Unknown-telephony.json",
                            std::string(kDirectory) + "/20231114-221320+0000-vela-Unknown-unknown.json"));
}

TEST_F(VelaReportingSessionSummaryTest, AnApplicationThatIsNoStringStandsInItsTextualForm) {
    makeInternalBuild();
    startedSession().setConfiguration(Dictionary{{"HostApplicationDisplayID", Array{1, 2}}});
    send({{"a", 1}});
    session().writeSummaryJson();
    EXPECT_THAT(fileSystem_.files(),
                ElementsAre(std::string(kDirectory) + "/20231114-221320+0000-vela-(1, 2)-haptics.json"));
}

TEST_F(VelaReportingSessionSummaryTest, APathRootStandsBeforeTheDirectory) {
    makeInternalBuild();
    platform_.pathRoot = "/tmp/root";
    startedSession();
    send({{"a", 1}});
    session().writeSummaryJson();
    EXPECT_THAT(fileSystem_.files(), ElementsAre(std::string("/tmp/root") + kPath));
}

TEST_F(VelaReportingSessionSummaryTest, AFileOfTheSameSecondIsReplaced) {
    makeInternalBuild();
    startedSession();
    send({{"a", 1}});
    session().writeSummaryJson();
    const auto other = makeSession(43);
    other->setServiceType(3);
    other->start();
    other->sendMessage({{"other", 2}}, 1, 1, {});
    other->writeSummaryJson();
    EXPECT_EQ(fileSystem_.files().size(), 1U);
    EXPECT_NE(file().value_or("").find("\"other\": 2"), std::string::npos);
}

TEST_F(VelaReportingSessionSummaryTest, ADirectoryThatCannotBeMadeIsLoggedAndTheFileTriedAnyway) {
    makeInternalBuild();
    fileSystem_.addFile("/private", "in the way");
    startedSession();
    send({{"a", 1}});
    log_.clear();
    session().stop();
    const auto lines = log_.linesOf("velarr");
    EXPECT_THAT(lines,
                Contains(sessionLine(LogLevel::Error, std::string("can't create logging directory at ") + kDirectory +
                                                          ": create folder " + kDirectory + ": Not a directory")));
    EXPECT_THAT(lines, Contains(sessionLine(LogLevel::Error, std::string("jsonOutput writeToURL: write ") + kPath +
                                                                 ": No such file or directory")));
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 1U);
    queues_.runUntilIdle();
    EXPECT_EQ(beacon_.operations().back(), BeaconOperation::EndSession);
}

TEST_F(VelaReportingSessionSummaryTest, ADirectoryThatCannotBeMadeButIsThereDoesNotKeepTheFileAway) {
    makeInternalBuild();
    fileSystem_.addFile(std::string(kDirectory) + "/old", "");
    fileSystem_.failOn(kDirectory, EACCES);
    startedSession();
    send({{"a", 1}});
    session().writeSummaryJson();
    EXPECT_TRUE(file().has_value());
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, std::string("jsonOutput writeToURL: ") + kPath));
}

TEST_F(VelaReportingSessionSummaryTest, AFileThatCannotBeWrittenIsLoggedUnderTheSameWordsAsAnError) {
    makeInternalBuild();
    fileSystem_.failOn(kPath, ENOSPC);
    startedSession();
    send({{"a", 1}});
    session().stop();
    EXPECT_THAT(log_.lines(), Contains(sessionLine(LogLevel::Error, std::string("jsonOutput writeToURL: write ") +
                                                                        kPath + ": No space left on device")));
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 1U);
}

TEST_F(VelaReportingSessionSummaryTest, JsonThatCannotBeMadeIsLoggedAndTheMethodGoesOn) {
    makeInternalBuild();
    json_.fail("a value is nested too deeply");
    startedSession();
    send({{"a", 1}});
    session().stop();
    EXPECT_THAT(log_.lines(),
                Contains(sessionLine(LogLevel::Error, "dataWithJSONObject: a value is nested too deeply")));
    EXPECT_EQ(file(), ""); // nothing of the torn text
    EXPECT_EQ(linesSaying("sending summary event for reporter 42"), 1U);
}

TEST_F(VelaReportingSessionSummaryTest, FailuresAreLoggedInOrderMessageDirectoryFile) {
    makeInternalBuild();
    json_.fail("a value is nested too deeply");
    fileSystem_.addFile("/private", "in the way");
    startedSession();
    send({{"a", 1}});
    log_.clear();
    session().writeSummaryJson();
    EXPECT_THAT(
        log_.lines(),
        ElementsAre(sessionLine(LogLevel::Error, "dataWithJSONObject: a value is nested too deeply"),
                    sessionLine(LogLevel::Error, std::string("can't create logging directory at ") + kDirectory +
                                                     ": create folder " + kDirectory + ": Not a directory"),
                    sessionLine(LogLevel::Error,
                                std::string("jsonOutput writeToURL: write ") + kPath + ": No such file or directory")));
}

TEST_F(VelaReportingSessionSummaryTest, AMessageThatCannotBeSerialisedReplacesAnOlderFileByAnEmptyOne) {
    makeInternalBuild();
    startedSession();
    send({{"a", 1}});
    session().writeSummaryJson();
    json_.fail("a value is nested too deeply");
    session().writeSummaryJson();
    EXPECT_EQ(file(), "");
    EXPECT_EQ(fileSystem_.permissionsOf(kPath), 0644U);
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, std::string("jsonOutput writeToURL: ") + kPath));
}

TEST_F(VelaReportingSessionSummaryTest, ALongFileIsWrittenInPieces) {
    makeInternalBuild();
    startedSession();
    sendLongMessages();
    session().writeSummaryJson();
    const std::string text = file().value_or("");
    EXPECT_EQ(text.size(), 2'800'618U);
    EXPECT_TRUE(text.starts_with("[\n  {\n    \"Generic_Start_1\": {\n      \"a\": \"aaaa"));
    EXPECT_TRUE(text.ends_with("gggg\",\n      \"audiotag\": \"GenericStart\"\n    }\n  }\n]"));
    for (int number = 2; number <= 7; ++number) {
        EXPECT_NE(text.find("\n  },\n  {\n    \"Generic_Start_" + std::to_string(number) + "\": {\n"),
                  std::string::npos)
            << number;
    }
    EXPECT_LT(fileSystem_.longestPiece(), 1'300'000U);
    EXPECT_GT(fileSystem_.longestPiece(), 1'048'576U);
}

TEST_F(VelaReportingSessionSummaryTest, WhatIsSentWhileTheFileIsWrittenIsNotInIt) {
    makeInternalBuild();
    startedSession();
    sendLongMessages();
    fileSystem_.setObserver([this] { send({{"late", 1}}); });
    session().writeSummaryJson();
    fileSystem_.setObserver(nullptr);
    EXPECT_THAT(recordedKeys(), Contains("Generic_Start_8"));
    const std::string text = file().value_or("");
    EXPECT_NE(text.find("Generic_Start_7"), std::string::npos);
    EXPECT_EQ(text.find("Generic_Start_8"), std::string::npos);
    EXPECT_TRUE(text.ends_with("    }\n  }\n]"));
}

TEST_F(VelaReportingSessionSummaryTest, AListThatEndsWhileItsFileIsWrittenLeavesWhatWasRead) {
    makeInternalBuild();
    startedSession();
    sendLongMessages();
    fileSystem_.setObserver([this] {
        VelaReportingSessionMessageList& list = session().nestedAggregatedPayloadData();
        const MutexLock lock(list.mutex());
        list.begin();
    });
    session().writeSummaryJson();
    fileSystem_.setObserver(nullptr);
    const std::string text = file().value_or("");
    EXPECT_NE(text.find("Generic_Start_3"), std::string::npos);
    EXPECT_EQ(text.find("Generic_Start_4"), std::string::npos);
    EXPECT_TRUE(text.ends_with("    }\n  }\n]"));
}

TEST_F(VelaReportingSessionSummaryTest, ALongFileThatCannotBeWrittenLeavesTheOldOne) {
    makeInternalBuild();
    fileSystem_.addFile(kPath, "old");
    fileSystem_.limitFileSize(2'000'000);
    startedSession();
    sendLongMessages();
    session().writeSummaryJson();
    EXPECT_EQ(file(), "old");
    EXPECT_EQ(log_.lines().back(),
              sessionLine(LogLevel::Error, std::string("jsonOutput writeToURL: write ") + kPath + ": File too large"));
}

TEST_F(VelaReportingSessionSummaryTest, AHostileApplicationNameStaysInTheDirectory) {
    makeInternalBuild();
    startedSession().setConfiguration(Dictionary{{"HostApplicationDisplayID", "../../etc/x"}});
    send({{"a", 1}});
    session().writeSummaryJson();
    EXPECT_THAT(fileSystem_.files(),
                ElementsAre(std::string(kDirectory) + "/20231114-221320+0000-vela-_._.._etc_x-haptics.json"));
}

} // namespace

} // namespace vela
