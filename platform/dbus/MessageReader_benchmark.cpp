// What it costs to take a message apart, to write one, and to answer one.
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"

#include <benchmark/benchmark.h>

namespace vela::platform::dbus {

namespace {

/// A message as audio processes send it: twelve entries.
Dictionary usualMessage() {
    return {{"play_seconds", 12.5}, {"route", "Speaker"},  {"sample_rate", 48000},
            {"channels", 2},        {"underruns", 0},      {"overloads", 3},
            {"is_spatial", false},  {"volume", 0.75},      {"process_name", "com.example.player"},
            {"format", "lpcm"},     {"latency_ms", 10.66}, {"frames", 9223372036LL}};
}

std::string usualCall() {
    std::string bytes;
    MessageWriter writer(bytes);
    writer.beginCall({.serial = 7,
                      .path = kObjectPath,
                      .interface = kReportingInterface,
                      .member = kSendMessage,
                      .signature = "a{sv}uqaax"});
    writer.dictionary(usualMessage());
    writer.uint32(3);
    writer.uint16(4);
    writer.optionalInt64s(std::vector<std::int64_t>{42});
    return writer.finish() ? bytes : std::string();
}

void ReadCall(benchmark::State& state) {
    const std::string bytes = usualCall();
    for (auto _ : state) {
        MessageHeader header;
        if (header.read(bytes)) {
            state.SkipWithError("no message");
        }
        BodyReader reader(header);
        const Dictionary message = reader.dictionary();
        reader.uint32();
        reader.uint16();
        const auto ids = reader.optionalInt64s();
        reader.finish();
        if (reader.error() || message.size() != 12) {
            state.SkipWithError("not read");
        }
        benchmark::DoNotOptimize(ids);
    }
    state.counters["bytes"] = static_cast<double>(bytes.size());
}
BENCHMARK(ReadCall);

void WriteCall(benchmark::State& state) {
    const Dictionary message = usualMessage();
    std::string bytes;
    for (auto _ : state) {
        bytes.clear();
        MessageWriter writer(bytes);
        writer.beginCall({.serial = 7,
                          .path = kObjectPath,
                          .interface = kReportingInterface,
                          .member = kSendMessage,
                          .signature = "a{sv}"});
        writer.dictionary(message);
        benchmark::DoNotOptimize(writer.finish());
    }
}
BENCHMARK(WriteCall);

void WriteReply(benchmark::State& state) {
    std::string bytes;
    for (auto _ : state) {
        bytes.clear();
        MessageWriter writer(bytes);
        writer.beginReturn({.serial = 7, .replySerial = 9, .signature = "b"});
        writer.boolean(true);
        benchmark::DoNotOptimize(writer.finish());
    }
}
BENCHMARK(WriteReply);

} // namespace

} // namespace vela::platform::dbus

BENCHMARK_MAIN();
