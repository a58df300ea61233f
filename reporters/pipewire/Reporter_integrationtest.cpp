// The built reporter between a real audio server and the real service.
#include "app/RunningService_integrationtest.h"
#include "common/VelaReportingVocabulary.h"
#include "platform/linux/FileDescriptor.h"
#include "platform/sqlite/StoreReader.h"
#include "reporters/pipewire/PausableStream_integrationtest.h"
#include "reporters/pipewire/PrivateAudioServer_integrationtest.h"

#include <algorithm>
#include <cmath>
#include <dirent.h>
#include <fstream>
#include <iterator>
#include <map>
#include <memory>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace vela::reporter {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;
using vela::testing::RunningProgram;
using vela::testing::waitUntil;
using Json = nlohmann::json;

/// Volume messages leave out shorter stretches.
constexpr double kShortestStretch = 0.5;
/// A longer one ends a run.
constexpr double kLongestSilence = 0.05;

struct Message {
    std::int64_t session = 0;
    std::uint32_t category = 0;
    std::uint32_t type = 0;
    Json payload;

    bool is(std::uint32_t wantedCategory, std::uint32_t wantedType) const {
        return category == wantedCategory && type == wantedType;
    }
    double time() const { return payload.value("velareporting_timestamp", 0.0); }
};

double now() { return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count(); }

/// Waits until that much sound was played since `since`, seconds since 1970.
void playUntil(double since, double seconds) {
    waitUntil([&] { return now() > since + seconds; });
}

class PipeWireReporterTest : public ::testing::Test {
protected:
    void SetUp() override {
        if (const std::string missing = PrivateAudioServer::missingPrograms(); !missing.empty()) {
            GTEST_SKIP() << "without " << missing;
        }
        service.emplace(std::vector<std::string>{"device.InternalBuild=true", "store.commit_ms=5", "drivers.Tarn=[]",
                                                 "drivers.Haptics=[]", "drivers.Rx=[\"channels\"]",
                                                 "drivers.Tx=[\"channels\"]"});
        audio.emplace();
        ASSERT_TRUE(audio->start());
    }

    void report(const std::vector<std::string>& settings = {}) {
        std::vector<std::string> words{VELA_PIPEWIRE_REPORTER};
        for (const std::string& setting : settings) {
            words.insert(words.end(), {"--set", setting});
        }
        std::vector<std::string> environment = audio->environment();
        environment.push_back("VELA_REPORTING_ADDRESS=" + service->address());
        environment.push_back("VELA_RUNTIME=" + service->folder("runtime"));
        reporter.emplace(words, environment);
        ASSERT_TRUE(waitUntil([this] { return connections() == 1; })) << reporter->error();
    }
    std::size_t connections() const {
        const std::string log = reporter->error();
        std::size_t count = 0;
        for (std::size_t at = 0; (at = log.find("connected to the audio server", at)) != std::string::npos; ++at) {
            ++count;
        }
        return count;
    }
    std::unique_ptr<RunningProgram> play(const std::vector<std::string>& options = {}) {
        std::vector<std::string> words{"pw-play"};
        words.insert(words.end(), options.begin(), options.end());
        words.push_back(audio->writeSound(120));
        return std::make_unique<RunningProgram>(audio->words(words), audio->environment());
    }

    /// What real-time reporting got so far, in its order.
    std::vector<Message> messages() const {
        std::vector<Message> result;
        auto opened = platform::StoreReader::open(service->folder("state/deliveries.db"));
        if (!opened) {
            return result;
        }
        platform::StoreReader reader = *std::move(opened);
        platform::StoreFilter filter;
        filter.backend = DeliveryBackend::Beacon;
        for (auto page = reader.read(filter); page && !page->empty(); page = reader.read(filter)) {
            for (const platform::StoredDelivery& delivery : *page) {
                if (delivery.operation == "send") {
                    result.push_back(
                        {delivery.session.value_or(0), static_cast<std::uint32_t>(delivery.category.value_or(0)),
                         static_cast<std::uint32_t>(delivery.type.value_or(0)), Json::parse(delivery.payload)});
                }
            }
            filter.after = page->back().seq;
        }
        return result;
    }
    std::vector<Message> messages(std::uint32_t category, std::uint32_t type) const {
        std::vector<Message> chosen = messages();
        std::erase_if(chosen, [&](const Message& message) { return !message.is(category, type); });
        return chosen;
    }
    /// The `count`th message of the kind, once it is there.
    Message await(std::uint32_t category, std::uint32_t type, std::size_t count = 1) const {
        std::vector<Message> found;
        EXPECT_TRUE(waitUntil([&] {
            found = messages(category, type);
            return found.size() >= count;
        })) << category
            << "/" << type << ": " << found.size() << " of " << count << "; " << reporter->error();
        return found.size() < count ? Message{} : found[count - 1];
    }
    Message awaitStart(std::size_t count = 1) const {
        return await(AudioEventCategoryPlayback, AudioEventTypeStart, count);
    }
    /// The first message on a stream's output whose payload is such, once it is there.
    template <class Condition>
    Message awaitOutput(Condition holds) const {
        std::vector<Message> found;
        EXPECT_TRUE(waitUntil([&] {
            found = messages(AudioEventCategoryOutput, AudioEventTypeState);
            std::erase_if(found, [&](const Message& message) { return !holds(message.payload); });
            return !found.empty();
        })) << reporter->error();
        return found.empty() ? Message{} : found.front();
    }
    Message awaitStop(std::size_t count = 1) const {
        return await(AudioEventCategoryPlayback, AudioEventTypeStop, count);
    }
    /// Every stop is followed by its session's summary.
    void awaitSummaries(std::size_t count) const {
        await(AudioEventCategoryAll & 0xFFFFU, AudioEventTypeUnknown, count);
    }
    struct Runs {
        std::vector<Message> starts;
        std::vector<Message> stops;

        double running() const {
            double seconds = 0;
            for (const Message& stop : stops) {
                seconds += stop.payload.at("session_duration").get<double>();
            }
            return seconds;
        }
        /// Between the runs.
        double silence() const { return stops.back().time() - starts.front().time() - running(); }
    };
    /// The runs of the one stream, once it has ended. It has several where a silence was long, as on an overloaded
    /// machine that of a move.
    Runs awaitEnd() const {
        Runs runs;
        const bool ended = waitUntil([&] {
            runs = {messages(AudioEventCategoryPlayback, AudioEventTypeStart),
                    messages(AudioEventCategoryPlayback, AudioEventTypeStop)};
            return !runs.stops.empty() && runs.stops.back().payload.at("reason") == "ended";
        });
        EXPECT_TRUE(ended) << reporter->error();
        awaitSummaries(runs.stops.size());
        EXPECT_EQ(runs.starts.size(), runs.stops.size());
        for (std::size_t i = 1; i < runs.starts.size(); ++i) {
            EXPECT_GT(runs.starts[i].time() - runs.stops[i - 1].time(), kLongestSilence) << i;
        }
        return runs;
    }
    std::vector<Message> volumeMessages() const { return messages(AudioEventCategoryVolume, AudioEventTypeSummary); }
    /// The statistics of all runs; those of a later one in place of an earlier one's, numbers added.
    Json statistics(std::uint32_t type) const {
        Json all = Json::object();
        for (const Message& message : messages(AudioEventCategoryHwStatsing, type)) {
            for (const auto& [key, value] : message.payload.items()) {
                all[key] = value.is_number() ? Json(value.get<int>() + all.value(key, 0)) : value;
            }
        }
        return all;
    }
    static double playSeconds(const std::vector<Message>& volumes) {
        double seconds = 0;
        for (const Message& volume : volumes) {
            seconds += volume.payload.at("play_seconds").get<double>();
        }
        return seconds;
    }
    /// The rows of the ledger by back end; the names of the columns under "backend".
    std::map<std::string, std::vector<std::string>> ledger() const {
        std::map<std::string, std::vector<std::string>> rows;
        std::istringstream lines(service->velactl({"status"}).out);
        for (std::string line; std::getline(lines, line);) {
            std::istringstream words(line);
            std::string name;
            words >> name;
            rows[name] = {std::istream_iterator<std::string>(words), {}};
        }
        return rows;
    }
    /// At one look: every look is a client, which the ledger counts as well.
    void expectBalance() const {
        const auto rows = ledger();
        EXPECT_THAT(rows.at("BACKEND"), ElementsAre("RECEIVED", "DELIVERED", "QUEUED", "REDUNDANT", "DROPPED"));
        for (const char* const backend : {"beacon", "tally"}) {
            std::vector<int> numbers;
            std::ranges::transform(rows.at(backend), std::back_inserter(numbers),
                                   [](const std::string& number) { return std::stoi(number); });
            ASSERT_EQ(numbers.size(), 5) << backend;
            EXPECT_EQ(numbers[0], numbers[1] + numbers[2] + numbers[3] + numbers[4]) << backend;
            EXPECT_EQ(numbers[4], 0) << backend;
        }
    }

    std::optional<RunningService> service;
    std::optional<PrivateAudioServer> audio;
    std::optional<RunningProgram> reporter;
};

TEST_F(PipeWireReporterTest, PlaysAtVolumesOverDevicesUntilTheClientIsKilled) {
    report();
    const auto player = play();
    const Message start = awaitStart();
    const std::uint32_t node = audio->nodeID("pw-play");

    playUntil(start.time(), 1.5 * kShortestStretch);
    audio->setParameters(node, "{channelVolumes:[0.125]}");
    const Message half = await(AudioEventCategoryVolume, AudioEventTypeState, 2);
    EXPECT_EQ(half.payload.at("NexoSessionVolume"), 0.5);

    playUntil(half.time(), 1.5 * kShortestStretch);
    audio->setParameters(node, "{mute:true}");
    const Message mute = await(AudioEventCategoryVolume, AudioEventTypeState, 3);
    EXPECT_EQ(mute.payload.at("NexoSessionVolume"), 0);
    EXPECT_EQ(mute.payload.at("muted"), true);

    playUntil(mute.time(), 1.5 * kShortestStretch);
    audio->setParameters(node, "{mute:false}");
    const Message loud = await(AudioEventCategoryVolume, AudioEventTypeState, 4);

    playUntil(loud.time(), 1.5 * kShortestStretch);
    audio->move(node, "headphones");
    const Message move = await(AudioEventCategoryRouteChange, AudioEventTypeState, 2);
    EXPECT_EQ(move.payload.at("active_devices"), "headphones");

    playUntil(move.time(), 1.5 * kShortestStretch);
    player->signal(SIGKILL);
    const Runs runs = awaitEnd();
    const Message& stop = runs.stops.back();
    EXPECT_EQ(stop.payload.at("session_output_running"), false);

    // The stretches are those that the test made, and together as long as the run.
    const std::vector<Message> volumes = volumeMessages();
    ASSERT_EQ(volumes.size(), 5);
    const std::vector<double> levels{1, 0.5, 0, 0.5, 0.5};
    const std::vector<double> times{start.time(), half.time(), mute.time(), loud.time(), move.time(), stop.time()};
    for (std::size_t i = 0; i < volumes.size(); ++i) {
        EXPECT_EQ(volumes[i].payload.at("NexoSessionVolume"), levels[i]) << i;
        EXPECT_EQ(volumes[i].payload.at("active_devices"), i < 4 ? "speaker" : "headphones") << i;
        EXPECT_EQ(volumes[i].payload.at("session_selected_format"), "S16LE 8000 Hz 1 ch") << i;
        EXPECT_EQ(volumes[i].payload.at("mChannelsPerFrame"), 1) << i;
        EXPECT_EQ(volumes[i].payload.at("HostApplicationDisplayID"), "pw-play") << i;
        EXPECT_NEAR(volumes[i].payload.at("play_seconds").get<double>(), times[i + 1] - times[i],
                    0.001 + runs.silence())
            << i;
    }
    EXPECT_NEAR(playSeconds(volumes), runs.running(), 0.001);
    EXPECT_NEAR(playSeconds(volumes), stop.time() - start.time() - runs.silence(), 0.001);
    expectBalance();
}

TEST_F(PipeWireReporterTest, DeliversWhatTheSinksDidMeanwhile) {
    report();
    const auto player = play();
    const Message start = awaitStart();
    playUntil(start.time(), 1);
    const std::uint32_t node = audio->nodeID("pw-play");
    audio->move(node, "headphones");
    // The move is told before the player has answered, and until then nothing plays there.
    const Message moved = awaitOutput([](const Json& output) {
        return output.at("device") == "headphones" && output.at("device_state") == "running";
    });
    playUntil(moved.time(), 1);
    player->signal(SIGTERM);
    const Runs runs = awaitEnd();

    const Json simple = statistics(AudioEventTypeSimple);
    const Json histogram = statistics(AudioEventTypeHistogram);
    const Json state = statistics(AudioEventTypeState);
    EXPECT_GT(simple.value("speaker_Speaker_Simple_cycles", 0), 0) << simple;
    EXPECT_GT(simple.value("headphones_Speaker_Simple_cycles", 0), 0) << simple;
    EXPECT_THAT(histogram.value("speaker_Speaker_Histogram_wait", ""), HasSubstr("unit=us")) << histogram;
    EXPECT_THAT(histogram.value("speaker_Speaker_Histogram_busy", ""), HasSubstr("unit=us"));
    EXPECT_THAT(state.value("headphones_Speaker_State_node", ""), HasSubstr("name:running")) << state;
    if (runs.stops.size() == 1) {
        EXPECT_THAT(histogram.value("Streams_StateTransitionTimesms_Histogram_move", ""), HasSubstr("unit=ms"));
    }
    // The service takes its first sample when it has handled the start; what was counted until then is missing in the
    // difference, and nothing else.
    double cycles = 0;
    for (const Message& summary : messages(AudioEventCategoryPerformance, AudioEventTypeSummary)) {
        cycles += summary.payload.at("cycles").get<double>();
    }
    EXPECT_LE(simple.value("Streams_Tx_Simple_cycles", 0), cycles);
    EXPECT_GE(simple.value("Streams_Tx_Simple_cycles", 0), cycles / 2);
    EXPECT_LE(simple.value("Streams_Tx_Simple_frames", 0) / 48000.0, runs.running() + 0.1) << simple;
}

TEST_F(PipeWireReporterTest, CountsAMoveWhoseSilenceBeginsLate) {
    report();
    const auto player = play();
    const Message start = awaitStart();
    playUntil(start.time(), 1.5 * kShortestStretch);
    const std::uint32_t node = audio->nodeID("pw-play");
    player->signal(SIGSTOP); // the server waits for its answer
    audio->move(node, "headphones");
    const Message move = await(AudioEventCategoryRouteChange, AudioEventTypeState, 2);
    EXPECT_EQ(move.payload.at("active_devices"), "headphones");
    player->signal(SIGCONT);
    const Message moved = awaitOutput([](const Json& output) {
        return output.at("device") == "headphones" && output.at("device_state") == "running";
    });
    playUntil(moved.time(), 1.5 * kShortestStretch);
    player->signal(SIGTERM);
    const Runs runs = awaitEnd();
    const Json histogram = statistics(AudioEventTypeHistogram);
    if (runs.stops.size() == 1) {
        EXPECT_THAT(histogram.value("Streams_StateTransitionTimesms_Histogram_move", ""), HasSubstr("unit=ms"));
    }
    EXPECT_FALSE(histogram.contains("Streams_StateTransitionTimesms_Histogram_ratechange")) << histogram;
}

TEST_F(PipeWireReporterTest, AnotherRateOfTheSinkDoesNotEndTheRun) {
    report();
    const auto player = play();
    const Message start = awaitStart();
    // The server has chosen one of its two rates for the sound.
    const std::string first =
        awaitOutput([](const Json& output) { return output.contains("device_format"); }).payload.at("device_format");
    const std::uint32_t other = first == "F32P 44100 Hz 2 ch" ? 48000 : 44100;
    playUntil(start.time(), 1.5 * kShortestStretch);
    audio->forceRate(other);
    const Message changed = awaitOutput([other](const Json& output) {
        return output.value("device_format", "") == "F32P " + std::to_string(other) + " Hz 2 ch";
    });
    playUntil(changed.time(), 1.5 * kShortestStretch);
    player->signal(SIGKILL);
    const Runs runs = awaitEnd(); // one, unless the silence was long
    ASSERT_EQ(volumeMessages().size(), runs.stops.size());
    EXPECT_NEAR(playSeconds(volumeMessages()), runs.running(), 0.001);
    EXPECT_LT(runs.silence(), 1);
    if (runs.stops.size() == 1) {
        EXPECT_THAT(
            statistics(AudioEventTypeHistogram).value("Streams_StateTransitionTimesms_Histogram_ratechange", ""),
            HasSubstr("unit=ms"));
    }
}

TEST_F(PipeWireReporterTest, APauseEndsTheRunAndThePlayingAfterItIsAnother) {
    report();
    std::optional<PausableStream> stream(std::in_place, audio->socket(), "game");
    ASSERT_TRUE(stream->isConnected());
    const Message start = awaitStart();
    playUntil(start.time(), 1.5 * kShortestStretch);
    stream->setActive(false);
    const Message pause = awaitStop();
    EXPECT_EQ(pause.payload.at("reason"), "paused");
    awaitSummaries(1);
    EXPECT_NEAR(playSeconds(volumeMessages()), pause.time() - start.time(), 0.001);

    stream->setActive(true);
    const Message again = awaitStart(2);
    EXPECT_EQ(again.session, start.session);
    EXPECT_EQ(again.payload.at("start_count"), 2);
    playUntil(again.time(), 1.5 * kShortestStretch);
    stream.reset();
    const Message stop = awaitStop(2);
    EXPECT_EQ(stop.payload.at("stop_count"), 2);
    awaitSummaries(2);
    EXPECT_NEAR(playSeconds(volumeMessages()), pause.time() - start.time() + stop.time() - again.time(), 0.001);
    for (const Message& error : messages(AudioEventCategoryError, AudioEventTypeError)) {
        // Incomplete cycles are true where the machine is overloaded.
        EXPECT_THAT(error.payload.dump(), HasSubstr("incomplete cycles"));
    }
    expectBalance();
}

TEST_F(PipeWireReporterTest, CaptureIsReportedAsRecording) {
    report();
    RunningProgram recorder(audio->words({"pw-record", audio->file("recorded.wav")}), audio->environment());
    const Message start = await(AudioEventCategoryRecord, AudioEventTypeStart);
    EXPECT_EQ(start.payload.at("session_input_running"), true);
    EXPECT_EQ(await(AudioEventCategoryRouteChange, AudioEventTypeState).payload.at("active_devices"), "microphone");
    recorder.signal(SIGTERM);
    const Message stop = await(AudioEventCategoryRecord, AudioEventTypeStop);
    EXPECT_EQ(stop.payload.at("session_output_running"), false);
    EXPECT_NEAR(stop.payload.at("session_duration").get<double>(), stop.time() - start.time(), 0.001);
    awaitSummaries(1);
    EXPECT_TRUE(volumeMessages().empty());
}

TEST_F(PipeWireReporterTest, AKilledAudioServerEndsTheRunAndTheNextOneIsWatched) {
    report();
    {
        const auto player = play();
        const Message start = awaitStart();
        playUntil(start.time(), 1.5 * kShortestStretch);
        audio->killServer();
        const Message stop = awaitStop();
        EXPECT_EQ(stop.payload.at("reason"), "ended");
        awaitSummaries(1);
        EXPECT_NEAR(playSeconds(volumeMessages()), stop.time() - start.time(), 0.001);
    }
    ASSERT_TRUE(audio->start());
    ASSERT_TRUE(waitUntil([this] { return connections() == 2; })) << reporter->error();
    const auto player = play();
    const Message start = awaitStart(2);
    EXPECT_NE(start.session, awaitStart(1).session);
    player->signal(SIGTERM);
    awaitStop(2);
    awaitSummaries(2);
}

TEST_F(PipeWireReporterTest, AServerThatEndsEveryConnectionIsCalledAfterEverLongerPauses) {
    const platform::FileDescriptor server(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    audio->file("closing").copy(&address.sun_path[0], sizeof(address.sun_path) - 1);
    ASSERT_EQ(bind(server.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
    ASSERT_EQ(listen(server.get(), 8), 0);
    report({"pipewire.remote=closing"});
    std::chrono::steady_clock::time_point first;
    for (int i = 0; i < 6; ++i) {
        constexpr int kMilliseconds = 30'000;
        pollfd calling{server.get(), POLLIN, 0};
        ASSERT_EQ(poll(&calling, 1, kMilliseconds), 1) << i;
        const platform::FileDescriptor connection(accept4(server.get(), nullptr, nullptr, SOCK_CLOEXEC));
        EXPECT_TRUE(connection);
        first = i == 0 ? std::chrono::steady_clock::now() : first;
    }
    // 50, 100, 200, 400 and 800 ms.
    EXPECT_GE(std::chrono::steady_clock::now() - first, std::chrono::milliseconds(1550));
}

TEST_F(PipeWireReporterTest, ARestartedSessionManagerLosesNoEnd) {
    report();
    const auto player = play();
    const Message start = awaitStart();
    playUntil(start.time(), 1.5 * kShortestStretch);
    audio->killManager(); // takes the stream's links with it
    ASSERT_TRUE(audio->startManager());
    player->signal(SIGKILL);
    ASSERT_TRUE(waitUntil([this] {
        return service->velactl({"sessions", "--json"}).out.empty();
    })) << service->velactl({"sessions"}).out;
    const auto starts = messages(AudioEventCategoryPlayback, AudioEventTypeStart);
    const auto stops = messages(AudioEventCategoryPlayback, AudioEventTypeStop);
    ASSERT_EQ(starts.size(), stops.size());
    double running = 0;
    for (const Message& stop : stops) {
        running += stop.payload.at("session_duration").get<double>();
    }
    EXPECT_GE(running, 1.5 * kShortestStretch);
    EXPECT_LE(running, now() - start.time());
}

TEST_F(PipeWireReporterTest, ARestartedServiceIsToldWhatWasPlayedBefore) {
    report();
    const auto player = play();
    const Message start = awaitStart();
    const std::uint32_t node = audio->nodeID("pw-play");
    playUntil(start.time(), 1.5 * kShortestStretch);
    audio->setParameters(node, "{channelVolumes:[0.125]}");
    const Message half = await(AudioEventCategoryVolume, AudioEventTypeState, 2);
    service->program().signal(SIGKILL);
    service->program().waitForEnd();
    playUntil(half.time(), 1.5 * kShortestStretch);
    service->start();
    player->signal(SIGKILL);
    const Message stop = awaitStop();
    awaitSummaries(1);
    ASSERT_EQ(volumeMessages().size(), 2);
    EXPECT_NEAR(playSeconds(volumeMessages()), stop.time() - start.time(), 0.001);
    EXPECT_NEAR(stop.payload.at("session_duration").get<double>(), stop.time() - start.time(), 0.001);
}

TEST_F(PipeWireReporterTest, AnEndWithoutAServiceIsToldToTheNextOne) {
    report();
    auto player = play();
    const Message start = awaitStart();
    playUntil(start.time(), 1.5 * kShortestStretch);
    service->program().signal(SIGTERM);
    service->program().waitForEnd();
    player.reset();
    const double killed = now();
    playUntil(killed, 0.1);
    service->start();
    const Message stop = awaitStop();
    awaitSummaries(1);
    EXPECT_NEAR(stop.time(), killed, 1);
    ASSERT_EQ(volumeMessages().size(), 1);
    EXPECT_NEAR(playSeconds(volumeMessages()), stop.time() - start.time(), 0.001);
}

TEST_F(PipeWireReporterTest, AReporterThatIsEndedEndsItsSessions) {
    report();
    const auto player = play();
    const Message start = awaitStart();
    playUntil(start.time(), 1.5 * kShortestStretch);
    reporter->signal(SIGTERM);
    EXPECT_EQ(reporter->waitForEnd(), 0);
    const Message stop = awaitStop();
    awaitSummaries(1);
    EXPECT_NEAR(playSeconds(volumeMessages()), stop.time() - start.time(), 0.001);
}

TEST_F(PipeWireReporterTest, StreamsAreLeftOutAndNamesKept) {
    report({"leave_out.nodes=[\"secret-*\"]", "names.applications=hash"});
    const auto secret = play({"-P", "{node.name=secret-one}"});
    audio->nodeID("secret-one");
    const auto player = play({"--media-role", "Notification", "-P", "{node.name=player event.id=message-new-instant}"});
    awaitStart();
    player->signal(SIGKILL);
    awaitStop();
    awaitSummaries(1);
    EXPECT_EQ(messages(AudioEventCategoryPlayback, AudioEventTypeStart).size(), 1);
    for (const Message& message : messages()) {
        EXPECT_THAT(message.payload.dump(), Not(HasSubstr("pw-play")));
        EXPECT_THAT(message.payload.dump(), Not(HasSubstr("secret")));
    }
    const std::string all = service
                                ->velactl({"deliveries", "--backend", "beacon", "--json", "--set",
                                           "paths.state=" + service->folder("state")})
                                .out;
    // A machine without an ID has nothing to hash names with.
    std::string machine;
    std::getline(std::ifstream("/etc/machine-id") >> std::ws, machine);
    if (machine.size() == 32) {
        EXPECT_THAT(all, HasSubstr("\"client_bundle_id\":\"app-"));
    } else {
        EXPECT_THAT(all, Not(HasSubstr("\"client_bundle_id\":\"app-")));
        EXPECT_THAT(reporter->error(), HasSubstr("names of applications are left out"));
    }
    EXPECT_THAT(all, HasSubstr("\"name\":\"alerts_session\""));
    EXPECT_THAT(all, Not(HasSubstr("pw-play")));
}

TEST_F(PipeWireReporterTest, DevicesHaveSessionsWhenTheyAreAskedFor) {
    report({"devices.sessions=true"});
    const auto player = play();
    awaitStart(2); // the stream's and the speaker's
    const auto starts = messages(AudioEventCategoryRouteChange, AudioEventTypeState);
    EXPECT_NE(starts.at(0).session, starts.at(1).session);
    player->signal(SIGKILL);
    awaitStop(2);
    const std::string sessions = service->velactl({"sessions", "--json"}).out;
    EXPECT_THAT(sessions, HasSubstr("\"speaker\""));
    EXPECT_THAT(sessions, HasSubstr("\"microphone\""));
    EXPECT_THAT(sessions, HasSubstr("audiodeviceusage"));
    // A device that rests for longer than a stream may is all right.
    playUntil(now(), 1.5);
    for (const Message& error : messages(AudioEventCategoryError, AudioEventTypeError)) {
        EXPECT_THAT(error.payload.dump(), HasSubstr("incomplete cycles"));
    }
}

/// How often any thread of the process gave up the processor because it had nothing to do.
std::map<std::string, std::uint64_t> waitsOf(pid_t process) {
    std::map<std::string, std::uint64_t> waits;
    const std::string folder = "/proc/" + std::to_string(process) + "/task";
    DIR* const tasks = opendir(folder.c_str());
    while (const dirent* const task = tasks == nullptr ? nullptr : readdir(tasks)) {
        std::ifstream lines(folder + "/" + task->d_name + "/status");
        for (std::string line; std::getline(lines, line);) {
            if (line.starts_with("voluntary_ctxt_switches:")) {
                waits[task->d_name] = std::stoull(line.substr(line.find(':') + 1));
            }
        }
    }
    if (tasks != nullptr) {
        closedir(tasks);
    }
    return waits;
}

TEST_F(PipeWireReporterTest, SleepsWhileNothingPlays) {
#if defined(__has_feature)
#if __has_feature(thread_sanitizer)
    GTEST_SKIP() << "the sanitizer has a thread of its own, which wakes ten times a second";
#endif
#endif
    report();
    // What the connection brought is done when nothing changes for a while.
    auto before = waitsOf(reporter->pid());
    ASSERT_TRUE(waitUntil([&] {
        const auto earlier = std::exchange(before, waitsOf(reporter->pid()));
        playUntil(now(), 0.2);
        return before == earlier && before == waitsOf(reporter->pid());
    }));
    playUntil(now(), 2);
    EXPECT_EQ(waitsOf(reporter->pid()), before);
}

TEST_F(PipeWireReporterTest, WrongSettingsStopTheStart) {
    const auto run = [this](const std::vector<std::string>& arguments) {
        std::vector<std::string> words{VELA_PIPEWIRE_REPORTER};
        words.insert(words.end(), arguments.begin(), arguments.end());
        return vela::testing::runProgram(words, audio->environment());
    };
    const auto wrong = run({"--set", "names.applications=loud"});
    EXPECT_EQ(wrong.status, 78);
    EXPECT_EQ(wrong.error, "--set: names.applications: \"loud\" is none of report, hash, omit\n");
    EXPECT_EQ(run({"--loud"}).status, 64);
    EXPECT_EQ(run({"--check"}).out, "The settings are right.\n");
    EXPECT_EQ(run({"--version"}).out, "vela-pipewire-reporter " VELA_VERSION "\n");
    std::ifstream file(VELA_EXAMPLE_SETTINGS);
    const std::string example((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    EXPECT_EQ(run({"--example"}).out, example);
}

} // namespace
} // namespace vela::reporter
