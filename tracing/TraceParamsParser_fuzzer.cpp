// Whatever a trace parameters file holds, loading it gives a record that keeps its rules, in bounded time.
#include "platform/plist/PropertyListCodec.h"
#include "tracing/TraceParamsParser.h"

#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>

namespace {

using namespace vela;

/// The input, whatever is asked for.
class OneFile final : public platform::FileSystem {
public:
    explicit OneFile(std::string content) : content_(std::move(content)) {}

    platform::Result<std::string> readFile(const std::string&, std::size_t limit) const override {
        return content_.size() <= limit ? platform::Result<std::string>(content_) : platform::Failure{0, "too large"};
    }
    platform::Result<std::string> readFileFor(const platform::Identity&, const std::string& path,
                                              std::size_t limit) const override {
        return readFile(path, limit);
    }
    std::unique_ptr<platform::PendingFile> createFile(const std::string&, std::uint32_t) override { return nullptr; }
    platform::Result<platform::Done> createDirectories(const std::string&, std::uint32_t) override {
        return platform::Failure{};
    }
    std::string currentDirectory() const override { return "/"; }

private:
    const std::string content_;
};

void require(bool holds, const char* what) {
    if (!holds) {
        std::cerr << what << '\n';
        std::abort();
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const OneFile file(std::string(data, data + size));
    const platform::PropertyListCodec codec;
    const auto params =
        TraceParamsParser::initWithFileName("/a", platform::Identity(), {file, codec}).loadTraceParams();
    require(params != nullptr, "no record");
    require(params->type == kTraceTypeSpoor || params->type == kTraceTypeMilestone, "a type that is none");
    std::size_t text = params->name.size();
    for (const auto& point : params->dataParams) {
        require(point->kind <= kTracePointLevel, "a kind that is none");
        require(point->kind != kTracePointImpulse || point->endCode == point->beginCode, "an impulse with an end");
        require(point->kind != kTracePointLevel || point->endCode == 0, "a level with an end");
        text += point->name.size();
    }
    require(text <= kTraceParamsTextBytes, "more text than is allowed");
    require(params->dataParams.size() <= kTraceParamsTextBytes / 32, "more points than there is text");
    return 0;
}
