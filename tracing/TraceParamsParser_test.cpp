#include "tracing/TraceParamsParser_test.h"

#include "common/values/Dictionary.h"
#include "testing/FakeFileSystem.h"
#include "testing/FakePropertyListReading.h"
#include "tracing/TraceParamsKeys.h"
#include "tracing/TraceParamsParser.h"

#include <algorithm>
#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>

namespace vela {

namespace {

using platform::Identity;
using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;

constexpr const char* kPath = "/tmp/traces.plist";

class TraceParamsParserTest : public ::testing::Test {
protected:
    TraceParams load(std::string name = kPath) {
        const auto parser = TraceParamsParser::initWithFileName(std::move(name), client_, {fileSystem_, lists_});
        auto params = parser.loadTraceParams();
        EXPECT_NE(params, nullptr);
        return std::move(*params);
    }
    TraceParams loadText(const std::string& text) {
        fileSystem_.addFile(kPath, text);
        return load();
    }
    /// A file whose content is this value.
    TraceParams loadValue(Value value) {
        lists_.set("the file", std::move(value));
        return loadText("the file");
    }
    /// One trace "T" with these points, in writing.
    TraceParams loadPoints(const std::string& points) {
        return loadText("{ Children = ({ Name = T; Children = (" + points + "); }); }");
    }
    /// The codes of an impulse with this value as its code, in writing.
    std::uint32_t codeOf(const std::string& text) {
        const TraceParams params = loadPoints("{ Type = Impulse; SpoorCodeBegin = " + text + "; }");
        return params.dataParams.at(0)->beginCode;
    }
    std::vector<std::string> errors() const {
        std::vector<std::string> messages;
        for (const auto& line : log_.lines()) {
            if (line.level == LogLevel::Error) {
                messages.push_back(line.message);
            }
        }
        return messages;
    }

    testing::CapturingLog log_;
    testing::FakeFileSystem fileSystem_;
    testing::FakePropertyListReading lists_;
    std::optional<Identity> client_{Identity{1000, 1000, {29}}};
};

// The file.

TEST_F(TraceParamsParserTest, TheFileNameIsKept) {
    const auto parser = TraceParamsParser::initWithFileName("a/b.plist", client_, {fileSystem_, lists_});
    EXPECT_EQ(parser.traceParamsFile(), "a/b.plist");
}

TEST_F(TraceParamsParserTest, AnAbsoluteNameIsTakenAsItStands) {
    fileSystem_.setCurrentDirectory("/srv");
    fileSystem_.addFile("/srv/tmp/traces.plist", "{ Children = ({ Name = wrong; }); }");
    fileSystem_.addFile("/tmp/traces.plist", "{ Children = ({ Name = right; }); }");
    EXPECT_EQ(load("/tmp/traces.plist").name, "right");
}

TEST_F(TraceParamsParserTest, ARelativeNameIsLookedForInTheCurrentDirectory) {
    fileSystem_.setCurrentDirectory("/srv");
    fileSystem_.addFile("/srv/traces.plist", "{ Children = ({ Name = right; }); }");
    EXPECT_EQ(load("traces.plist").name, "right");
}

TEST_F(TraceParamsParserTest, ARelativeNameBelowTheRootHasOneSlash) {
    fileSystem_.addFile("/traces.plist", "{ Children = ({ Name = right; }); }");
    EXPECT_EQ(load("traces.plist").name, "right");
}

TEST_F(TraceParamsParserTest, AnEmptyNameIsTheCurrentDirectoryAndNoFile) {
    fileSystem_.addFile("/srv/a", "");
    fileSystem_.setCurrentDirectory("/srv");
    load("");
    EXPECT_EQ(errors().front(), "Reading from plist file failed with error: read /srv: not a regular file");
}

TEST_F(TraceParamsParserTest, TheFileIsReadForTheClientThatNamedIt) {
    loadText("{}");
    EXPECT_THAT(fileSystem_.readers(), ElementsAre(Identity{1000, 1000, {29}}));
}

TEST_F(TraceParamsParserTest, WhatTheClientMayNotReadIsNotRead) {
    fileSystem_.addFile(kPath, "{ Children = ({ Name = secret; }); }", 0600);
    EXPECT_EQ(load().name, "");
    EXPECT_EQ(errors().front(), "Reading from plist file failed with error: open /tmp/traces.plist: Permission denied");
    EXPECT_EQ(errors().back(), "No valid input found in plist.");
}

TEST_F(TraceParamsParserTest, AnUnknownClientReadsNothing) {
    client_.reset();
    fileSystem_.addFile(kPath, "{ Children = ({ Name = public; }); }");
    EXPECT_EQ(load().name, "");
    EXPECT_EQ(errors().front(), "Reading from plist file failed with error: open /tmp/traces.plist: nobody can tell "
                                "which user named it");
    EXPECT_THAT(fileSystem_.readers(), IsEmpty());
}

TEST_F(TraceParamsParserTest, AFileThatIsNotThereGivesAnEmptyRecord) {
    const TraceParams params = load("/missing");
    EXPECT_EQ(params.name, "");
    EXPECT_EQ(params.type, 0);
    EXPECT_THAT(params.dataParams, IsEmpty());
    ASSERT_THAT(log_.lines(), Not(IsEmpty()));
    EXPECT_EQ(log_.lines().front(),
              traceParamsLine(LogLevel::Error,
                              "Reading from plist file failed with error: open /missing: No such file or directory"));
    EXPECT_EQ(log_.lines().back(), traceParamsLine(LogLevel::Error, "No valid input found in plist."));
}

TEST_F(TraceParamsParserTest, AFileOfMoreThan256KiBIsNotRead) {
    loadText("{ Children = ({ Name = T; }); }" + std::string(256 * 1024, ' '));
    EXPECT_EQ(errors().front(), "Reading from plist file failed with error: read /tmp/traces.plist: larger than its "
                                "limit of 262144 bytes");
    EXPECT_EQ(errors().back(), "No valid input found in plist.");
}

TEST_F(TraceParamsParserTest, AFileOf256KiBIsRead) {
    const std::string text = "{ Children = ({ Name = T; }); }";
    EXPECT_EQ(loadText(text + std::string(256 * 1024 - text.size(), ' ')).name, "T");
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(TraceParamsParserTest, AFileThatIsNoPropertyListGivesAnEmptyRecord) {
    const TraceParams params = loadText("x y");
    EXPECT_EQ(params.name, "");
    EXPECT_EQ(params.type, 0);
    EXPECT_THAT(params.dataParams, IsEmpty());
    EXPECT_THAT(log_.lines(),
                ElementsAre(traceParamsLine(LogLevel::Error,
                                            "Reading from plist file failed with error: property list: line 1, column "
                                            "3: there is something after the value"),
                            traceParamsLine(LogLevel::Error, "No valid input found in plist.")));
}

TEST_F(TraceParamsParserTest, AnEmptyFileIsNoPropertyList) {
    EXPECT_THAT(loadText("").dataParams, IsEmpty());
    EXPECT_THAT(errors(), ElementsAre("Reading from plist file failed with error: property list: line 1, column 1: "
                                      "there is no value",
                                      "No valid input found in plist."));
}

TEST_F(TraceParamsParserTest, AFileThatIsNoDictionaryIsEmptyWithoutAWord) {
    for (const char* const text : {"word", "(a, b)", "<00>", "{}"}) {
        const TraceParams params = loadText(text);
        EXPECT_EQ(params.name, "") << text;
        EXPECT_EQ(params.type, 0) << text;
        EXPECT_THAT(params.dataParams, IsEmpty()) << text;
    }
    EXPECT_THAT(log_.lines(), IsEmpty());
}

// The record.

TEST_F(TraceParamsParserTest, AWholeFile) {
    const TraceParams params = loadText("{ Children = ("
                                        "{ Name = Start; TraceType = spoor; IsCritical = YES; Children = ("
                                        "{ Name = open; Type = Interval; SpoorCodeBegin = 0x21040010;"
                                        "  SpoorCodeEnd = 21040014; EventsMatchedBy = Thread; },"
                                        "{ Name = tick; Type = Impulse; SpoorCodeBegin = 0X2a; } ); },"
                                        "{ Name = Later; TraceType = spoor; Children = ("
                                        "{ Name = fill; Type = Level; SpoorCodeBegin = ff; SpoorCodeEnd = ff;"
                                        "  EventsMatchedBy = Process; } ); } ); }");
    EXPECT_EQ(params.name, "Start");
    EXPECT_EQ(params.type, 0);
    EXPECT_THAT(pointsOf(params), ElementsAre("open interval 553910288 553910292 thread", "tick impulse 42 42 process",
                                              "fill level 255 0 process"));
    EXPECT_THAT(log_.lines(),
                ElementsAre(traceParamsLine(LogLevel::Info,
                                            "Loading tracepoint : 553910288 and 553910292 \n finished parsing."),
                            traceParamsLine(LogLevel::Info, "Loading tracepoint : 42 and 0 \n finished parsing."),
                            traceParamsLine(LogLevel::Info, "Loading tracepoint : 255 and 0 \n finished parsing.")));
}

TEST_F(TraceParamsParserTest, TwoTracesAreOneRecordWithTheFirstsName) {
    const TraceParams params = loadText("{ Children = ("
                                        "{ Name = A; Children = ({ Name = a1; Type = Level; }, { Name = a2; Type = "
                                        "Level; }); }, { Name = B; Children = ({ Name = b1; Type = Level; }); } ); }");
    EXPECT_EQ(params.name, "A");
    EXPECT_THAT(pointsOf(params), ElementsAre("a1 level 0 0 process", "a2 level 0 0 process", "b1 level 0 0 process"));
}

TEST_F(TraceParamsParserTest, ATraceWithoutANameIsNamedNull) {
    EXPECT_EQ(loadText("{ Children = ({}, { Name = B; }); }").name, "(null)");
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceParamsParserTest, AnEmptyNameIsToldAndTheNextOneTaken) {
    EXPECT_EQ(loadText("{ Children = ({ Name = \"\"; }, { Name = \"\"; }, { Name = C; }, { Name = \"\"; }); }").name,
              "C");
    EXPECT_THAT(log_.lines(), ElementsAre(traceParamsLine(LogLevel::Error, "Description not found in the plist file"),
                                          traceParamsLine(LogLevel::Error, "Description not found in the plist file")));
}

TEST_F(TraceParamsParserTest, WithoutTracesThereIsNoName) {
    EXPECT_EQ(loadText("{ Children = (); }").name, "");
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceParamsParserTest, OneMilestoneMakesTheWholeFileMilestones) {
    EXPECT_EQ(
        loadText("{ Children = ({ TraceType = spoor; }, { TraceType = Milestone; }, { TraceType = spoor; }); }").type,
        1);
}

TEST_F(TraceParamsParserTest, EveryOtherTypeIsTheKernelTrace) {
    EXPECT_EQ(loadText("{ Children = ({ TraceType = milestone; }, { TraceType = \"Milestone \"; }, {},"
                       "{ TraceType = (Milestone); }); }")
                  .type,
              0);
}

TEST_F(TraceParamsParserTest, WhetherATraceIsCriticalIsNotRead) {
    const TraceParams with =
        loadText("{ Children = ({ Name = T; IsCritical = NO; Children = ({ Type = Level; }); }); }");
    EXPECT_THAT(pointsOf(with), ElementsAre("(null) level 0 0 process"));
}

// Missing and wrong levels.

TEST_F(TraceParamsParserTest, MissingLevelsAreEmptyWithoutAWord) {
    EXPECT_THAT(loadText("{ Other = 1; }").dataParams, IsEmpty());
    const TraceParams params = loadText("{ Children = ({ Name = T; }); }");
    EXPECT_EQ(params.name, "T");
    EXPECT_THAT(params.dataParams, IsEmpty());
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceParamsParserTest, LevelsOfAnotherKindAreEmptyWithoutAWord) {
    for (const Value& level :
         {Value(4660), Value(true), Value("word"), Value(Data("x")), Value(Dictionary{{"a", 1}})}) {
        const TraceParams params = loadValue(Dictionary{{"Children", level}});
        EXPECT_EQ(params.name, "");
        EXPECT_THAT(params.dataParams, IsEmpty());
        const TraceParams points =
            loadValue(Dictionary{{"Children", Array{Value(Dictionary{{"Name", "T"}, {"Children", level}})}}});
        EXPECT_EQ(points.name, "T");
        EXPECT_THAT(points.dataParams, IsEmpty());
    }
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceParamsParserTest, ATraceThatIsNoDictionaryIsAnEmptyOne) {
    EXPECT_EQ(loadText("{ Children = (word, { Name = T; }); }").name, "(null)");
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(TraceParamsParserTest, APointThatIsNoDictionaryIsAnEmptyOne) {
    EXPECT_THAT(pointsOf(loadPoints("word, (a)")),
                ElementsAre("(null) impulse 0 0 process", "(null) impulse 0 0 process"));
}

TEST_F(TraceParamsParserTest, LevelsInWritingAreRead) {
    const auto written = [](const Value& value) { return Value(std::string_view(textualForm(value))); };
    const Dictionary point{{"Name", "p"}, {"Type", "Level"}, {"SpoorCodeBegin", "10"}};
    const Dictionary trace{{"Name", "T"}, {"Children", written(Array{written(point)})}};
    const TraceParams params = loadValue(Dictionary{{"Children", written(Array{written(trace)})}});
    EXPECT_EQ(params.name, "T");
    EXPECT_THAT(pointsOf(params), ElementsAre("p level 16 0 process"));
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(TraceParamsParserTest, ATextThatIsNoListOfTracesIsTold) {
    EXPECT_EQ(loadText("{ Children = \"x y\"; }").name, "");
    EXPECT_THAT(log_.lines(), ElementsAre(traceParamsLine(
                                  LogLevel::Error, "Failed to load Trace Parameter Array with error: property list: "
                                                   "line 1, column 3: there is something after the value")));
}

TEST_F(TraceParamsParserTest, ATextThatIsNoTraceIsTold) {
    EXPECT_EQ(loadText("{ Children = (\"x y\"); }").name, "(null)");
    EXPECT_THAT(log_.lines(), ElementsAre(traceParamsLine(
                                  LogLevel::Error, "Failed to load Trace Parameter dictionary with error : property "
                                                   "list: line 1, column 3: there is something after the value")));
}

TEST_F(TraceParamsParserTest, ATextThatIsNoListOfPointsIsTold) {
    EXPECT_EQ(loadText("{ Children = ({ Name = T; Children = \"\"; }); }").name, "T");
    EXPECT_THAT(log_.lines(),
                ElementsAre(traceParamsLine(LogLevel::Error, "Failed to read the Trace Points from the plist file with "
                                                             "error: property list: line 1, column 1: there is no "
                                                             "value")));
}

TEST_F(TraceParamsParserTest, ATextThatIsNoPointIsToldAndThePointStaysEmpty) {
    EXPECT_THAT(pointsOf(loadPoints("\"x y\"")), ElementsAre("(null) impulse 0 0 process"));
    EXPECT_THAT(
        log_.lines(),
        ElementsAre(traceParamsLine(LogLevel::Error, "Failed to read Trace Point from Trace Points dictionary. Failed "
                                                     "with error: property list: line 1, column 3: there is something "
                                                     "after the value"),
                    traceParamsLine(LogLevel::Error, "TracePointType field not recognized or is empty."),
                    traceParamsLine(LogLevel::Info, "Loading tracepoint : 0 and 0 \n finished parsing.")));
}

// Points.

TEST_F(TraceParamsParserTest, OnlyTheExactWordThreadMatchesByThread) {
    EXPECT_THAT(pointsOf(loadPoints("{ Name = a; Type = Level; EventsMatchedBy = Thread; },"
                                    "{ Name = b; Type = Level; EventsMatchedBy = thread; },"
                                    "{ Name = c; Type = Level; EventsMatchedBy = Process; },"
                                    "{ Name = d; Type = Level; }")),
                ElementsAre("a level 0 0 thread", "b level 0 0 process", "c level 0 0 process", "d level 0 0 process"));
}

TEST_F(TraceParamsParserTest, AnImpulsesEndIsItsBegin) {
    EXPECT_THAT(pointsOf(loadPoints("{ Name = a; Type = Impulse; SpoorCodeBegin = 0x2a; SpoorCodeEnd = 0x2b; }")),
                ElementsAre("a impulse 42 42 process"));
}

TEST_F(TraceParamsParserTest, ALevelHasNoEnd) {
    EXPECT_THAT(pointsOf(loadPoints("{ Name = a; Type = Level; SpoorCodeBegin = 0x2a; SpoorCodeEnd = 0x2b; }")),
                ElementsAre("a level 42 0 process"));
}

TEST_F(TraceParamsParserTest, CodesBelongToTheirOwnPoint) {
    EXPECT_THAT(pointsOf(loadPoints("{ Name = a; Type = Interval; SpoorCodeBegin = 1; SpoorCodeEnd = 2; },"
                                    "{ Name = b; Type = Interval; }")),
                ElementsAre("a interval 1 2 process", "b interval 0 0 process"));
}

TEST_F(TraceParamsParserTest, AnUnknownTypeIsToldAndKeepsTheKindOfThePointBefore) {
    EXPECT_THAT(pointsOf(loadPoints("{ Name = a; Type = Interval; SpoorCodeBegin = 1; SpoorCodeEnd = 2; },"
                                    "{ Name = b; Type = level; SpoorCodeBegin = 3; SpoorCodeEnd = 4; },"
                                    "{ Name = c; SpoorCodeBegin = 5; }")),
                ElementsAre("a interval 1 2 process", "b interval 0 0 process", "c interval 0 0 process"));
    const auto unknown = traceParamsLine(LogLevel::Error, "TracePointType field not recognized or is empty.");
    const auto nothing = traceParamsLine(LogLevel::Info, "Loading tracepoint : 0 and 0 \n finished parsing.");
    EXPECT_THAT(log_.lines(),
                ElementsAre(traceParamsLine(LogLevel::Info, "Loading tracepoint : 1 and 2 \n finished parsing."),
                            unknown, nothing, unknown, nothing));
}

TEST_F(TraceParamsParserTest, TheKindStaysFromOneTraceToTheNext) {
    EXPECT_THAT(pointsOf(loadText("{ Children = ({ Name = A; Children = ({ Name = a; Type = Level; }); },"
                                  "{ Name = B; Children = ({ Name = b; Type = \"\"; }); }); }")),
                ElementsAre("a level 0 0 process", "b level 0 0 process"));
}

TEST_F(TraceParamsParserTest, TheFirstPointOfAFileIsAnImpulseWhileItsTypeIsUnknown) {
    loadPoints("{ Name = a; Type = Interval; }");
    EXPECT_THAT(pointsOf(loadPoints("{ Name = b; }")), ElementsAre("b impulse 0 0 process"));
}

TEST_F(TraceParamsParserTest, CodesAreShownAsSignedNumbers) {
    const TraceParams params = loadPoints("{ Type = Interval; SpoorCodeBegin = 90000000; SpoorCodeEnd = 0xFFFFFFFF; }");
    EXPECT_EQ(params.dataParams.at(0)->beginCode, 0x90000000U);
    EXPECT_THAT(log_.lines(), ElementsAre(traceParamsLine(
                                  LogLevel::Info, "Loading tracepoint : -1879048192 and -1 \n finished parsing.")));
}

TEST_F(TraceParamsParserTest, APointsNameMayBeEmptyOrMissing) {
    EXPECT_THAT(pointsOf(loadPoints("{ Name = \"\"; Type = Level; }, { Type = Level; }")),
                ElementsAre(" level 0 0 process", "(null) level 0 0 process"));
}

// Values as texts.

TEST_F(TraceParamsParserTest, NumbersAreReadAsTheirDigits) {
    const Dictionary point{{"Name", 12.0}, {"Type", "Interval"}, {"SpoorCodeBegin", 4660}, {"SpoorCodeEnd", 12.0}};
    const TraceParams params = loadValue(
        Dictionary{{"Children", Array{Value(Dictionary{{"Name", true}, {"Children", Array{Value(point)}}})}}});
    EXPECT_EQ(params.name, "1");
    EXPECT_THAT(pointsOf(params), ElementsAre("12 interval 18016 18 process"));
}

TEST_F(TraceParamsParserTest, DatesAndDataAreReadAsTheirText) {
    const TraceParams params =
        loadValue(Dictionary{{"Children", Array{Value(Dictionary{{"Name", Date{1795219200}}})}}});
    EXPECT_EQ(params.name, "2026-11-21 00:00:00 +0000");
    EXPECT_EQ(loadText("{ Children = ({ Name = <0fbd>; }); }").name, "<0fbd>");
}

TEST_F(TraceParamsParserTest, AContainerAsANameIsItsText) {
    EXPECT_EQ(loadText("{ Children = ({ Name = (a, \"b c\"); }); }").name, "(a, \"b c\")");
}

TEST_F(TraceParamsParserTest, NamesComeBackUnchanged) {
    const std::string name =
        "a \"quoted\"; {brace} (bracket) <angle> \\back\nline\ttab = \xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80";
    const Dictionary point{{"Name", std::string_view(name)}, {"Type", "Level"}};
    const TraceParams params = loadValue(Dictionary{
        {"Children", Array{Value(Dictionary{{"Name", std::string_view(name)}, {"Children", Array{Value(point)}}})}}});
    EXPECT_EQ(params.name, name);
    EXPECT_EQ(params.dataParams.at(0)->name, name);
}

TEST_F(TraceParamsParserTest, WhatAFileSaysCannotForgeALine) {
    loadText("{ Children = \"a\nb c\"; }");
    loadText("{ Children = ({ Name = \"\"; Children = \"\\\"\nerror\"; }); }");
    for (const auto& line : log_.lines()) {
        EXPECT_THAT(line.message, Not(HasSubstr("\n"))) << line;
    }
}

// Codes.

TEST(TraceEventCodeTest, LeadingHexadecimalDigitsCount) {
    EXPECT_EQ(traceEventCodeOf("0x2a"), 42U);
    EXPECT_EQ(traceEventCodeOf("0X2A"), 42U);
    EXPECT_EQ(traceEventCodeOf("2A"), 42U);
    EXPECT_EQ(traceEventCodeOf("2axyz"), 42U);
    EXPECT_EQ(traceEventCodeOf("00000000002a"), 42U);
    EXPECT_EQ(traceEventCodeOf("ffffffff"), 4294967295U);
}

TEST(TraceEventCodeTest, WithoutDigitsThereIsNone) {
    for (const char* const text : {"xyz", "", "0x", "0xg", "(null)", "-2a", "+2a", "x2a", " "}) {
        EXPECT_EQ(traceEventCodeOf(text), 0U) << text;
    }
}

TEST(TraceEventCodeTest, MoreThan32BitsAreTheLargestCode) {
    EXPECT_EQ(traceEventCodeOf("100000000"), 4294967295U);
    EXPECT_EQ(traceEventCodeOf("0x" + std::string(1000, 'f')), 4294967295U);
}

TEST_F(TraceParamsParserTest, CodesOfAFileAreScanned) {
    EXPECT_EQ(codeOf("0x2a"), 42U);
    EXPECT_EQ(codeOf("\"-2a\""), 0U);
    EXPECT_EQ(codeOf("(2a)"), 0U);
    EXPECT_EQ(codeOf("1FFFFFFFF"), 4294967295U);
}

// What a hostile file costs.

TEST_F(TraceParamsParserTest, ContainersStandAtMost128Deep) {
    loadText("{ Children = " + std::string(127, '(') + std::string(127, ')') + "; }");
    EXPECT_THAT(errors(), IsEmpty());
    loadText("{ Children = " + std::string(128, '(') + std::string(128, ')') + "; }");
    EXPECT_THAT(errors(), ElementsAre(AllOf(HasSubstr("Reading from plist file failed with error: "), HasSubstr("128")),
                                      "No valid input found in plist."));
    log_.clear();
    loadText(std::string(200'000, '('));
    EXPECT_EQ(errors().back(), "No valid input found in plist.");
}

TEST_F(TraceParamsParserTest, SharedTextsDoNotExpandWithoutBound) {
    // 2,000 times the same 100,000 bytes: 800 MB of text at most, 200 MB at least.
    ArrayBuilder traces;
    const Value shared(std::string_view(std::string(100'000, 'x')));
    for (int number = 0; number < 2000; ++number) {
        traces.add(shared);
    }
    const TraceParams params = loadValue(Dictionary{{"Children", traces.build()}});
    EXPECT_EQ(params.name, "");
    EXPECT_THAT(errors(), ElementsAre("Failed to load Trace Parameter Array with error: the levels of the file have "
                                      "more text together than the limit of 16777216 bytes"));
}

TEST_F(TraceParamsParserTest, TheLimitOfTextIsThatOfAllLevelsTogether) {
    // 4.8 million bytes at most for each of the first three levels, which leaves less than 2.4 million for the points.
    const Value name(std::string_view(std::string(100'000, 'x')));
    ArrayBuilder points;
    for (int number = 0; number < 12; ++number) {
        points.add(Dictionary{{"Type", "Level"}, {"Name", name}});
    }
    const TraceParams params =
        loadValue(Dictionary{{"Children", Array{Value(Dictionary{{"Name", "T"}, {"Children", points.build()}})}}});
    EXPECT_EQ(params.name, "T");
    ASSERT_EQ(params.dataParams.size(), 12U);
    EXPECT_EQ(params.dataParams[4]->name.size(), 100'000U);
    EXPECT_EQ(params.dataParams[5]->name, "(null)");
    const std::string text = "Failed to read Trace Point from Trace Points dictionary. Failed with error: the levels "
                             "of the file have more text together than the limit of 16777216 bytes";
    const auto told = errors();
    EXPECT_EQ(std::count(told.begin(), told.end(), text), 7);
}

TEST_F(TraceParamsParserTest, TenThousandPointsAreRead) {
    std::string points;
    for (int number = 0; number < 10'000; ++number) {
        points += "{Type=Level;},";
    }
    EXPECT_EQ(loadPoints(points).dataParams.size(), 10'000U);
    EXPECT_THAT(errors(), IsEmpty());
}

} // namespace

} // namespace vela
