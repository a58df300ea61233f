#include "tracing/TraceParamsParser.h"

#include "common/VelaReportingLogCategories.h"
#include "common/values/Dictionary.h"
#include "common/values/TextualForm.h"
#include "tracing/TraceParamsKeys.h"

#include <cerrno>
#include <charconv>
#include <limits>
#include <system_error>
#include <utility>

namespace vela {

namespace {

using platform::Failure;
using platform::Result;

const LogCategory& traceLog() { return VelaReportingTraceCategory(); }

/// What a container's brackets, an entry's or an element's marks, and a number or date take at most.
constexpr std::size_t kMostBesideLeaves = 32;

/// What `text` takes at most as a leaf: every character an escape, and quotation marks.
std::size_t mostBytesOfLeaf(std::string_view text) { return 4 * text.size() + 2; }

/// At least as many bytes as the textual form of `value` has, found without making it.
std::size_t mostTextBytes(ValueRef value) {
    std::size_t bytes = kMostBesideLeaves;
    switch (value.kind()) {
    case ValueKind::String:
        return bytes + mostBytesOfLeaf(value.text());
    case ValueKind::Data:
        return bytes + mostBytesOfLeaf(value.bytes());
    case ValueKind::Array:
        for (const ValueRef element : value.array()) {
            bytes += mostTextBytes(element);
        }
        return bytes;
    case ValueKind::Dictionary:
        for (const auto& [key, inside] : value.dictionary()) {
            bytes += mostBytesOfLeaf(key.text()) + mostTextBytes(inside);
        }
        return bytes;
    default:
        return bytes;
    }
}

Array arrayOf(const Value& value) { return value.ref().isArray() ? value.ref().array() : Array(); }

Dictionary dictionaryOf(const Value& value) {
    return value.ref().isDictionary() ? value.ref().dictionary() : Dictionary();
}

void logReadingFailure(const Failure& failure) {
    traceLog().error("Reading from plist file failed with error: %@", failure.description);
}

/// The value of `key` as text; "(null)" for a missing one.
std::string textOf(const Dictionary& dictionary, const Key& key) { return textualForm(dictionary.find(key)); }

/// The codes that stand in the file.
struct ScannedCodes {
    std::uint32_t begin = 0;
    std::uint32_t end = 0;
};

/// One load: the levels of one file, and the record that they fill.
class Loading {
public:
    explicit Loading(const platform::PropertyListReading& propertyLists) : propertyLists_(propertyLists) {}

    std::unique_ptr<TraceParams> load(ValueRef file);

private:
    Value readAgain(ValueRef level, std::string& error);

    void addTrace(ValueRef level);
    void addPoint(ValueRef level);
    ScannedCodes scanPoint(const Dictionary& point);

    const platform::PropertyListReading& propertyLists_;
    std::unique_ptr<TraceParams> params_ = std::make_unique<TraceParams>();
    std::size_t textBytes_ = 0; ///< of the levels so far, at most
    /// Of the last point. Stays for one whose type is not known, also from one trace to the next: wanted.
    std::uint32_t kind_ = kTracePointImpulse;
};

std::unique_ptr<TraceParams> Loading::load(ValueRef file) {
    const ValueRef children = file.isDictionary() ? file.dictionary().find(TraceParamChildrenNodes) : ValueRef();
    std::string error;
    const Value traces = readAgain(children, error);
    if (!error.empty()) {
        traceLog().error("Failed to load Trace Parameter Array with error: %@", error);
    }
    for (const ValueRef trace : arrayOf(traces)) {
        addTrace(trace);
    }
    return std::move(params_);
}

/// `level` through its text form. None with `error` set when the text is no property list; none for none.
Value Loading::readAgain(ValueRef level, std::string& error) {
    // The text of a missing value, "(null)", would be read as an array of one text.
    if (!level) {
        return {};
    }
    textBytes_ += mostTextBytes(level);
    if (textBytes_ > kTraceParamsTextBytes) {
        error = "the levels of the file have more text together than the limit of " +
                std::to_string(kTraceParamsTextBytes) + " bytes";
        return {};
    }
    Result<Value> again = propertyLists_.read(textualForm(level), {.bytes = kTraceParamsTextBytes});
    if (!again) {
        error = again.failure().description;
        return {};
    }
    return *std::move(again);
}

void Loading::addTrace(ValueRef level) {
    std::string error;
    const Dictionary trace = dictionaryOf(readAgain(level, error));
    if (!error.empty()) {
        traceLog().error("Failed to load Trace Parameter dictionary with error : %@", error);
    }
    if (params_->name.empty()) {
        params_->name = textOf(trace, TraceDataDescription);
        if (params_->name.empty()) {
            traceLog().error("Description not found in the plist file");
        }
    }
    if (textOf(trace, TraceDataType) == TraceDataTypeMilestone) {
        params_->type = kTraceTypeMilestone; // for the whole file, whatever others say
    }
    error.clear();
    const Value points = readAgain(trace.find(TraceDataChildrenNodes), error);
    if (!error.empty()) {
        traceLog().error("Failed to read the Trace Points from the plist file with error: %@", error);
    }
    for (const ValueRef point : arrayOf(points)) {
        addPoint(point);
    }
}

void Loading::addPoint(ValueRef level) {
    std::string error;
    const Dictionary point = dictionaryOf(readAgain(level, error));
    if (!error.empty()) {
        traceLog().error("Failed to read Trace Point from Trace Points dictionary. Failed with error: %@", error);
    }
    const ScannedCodes codes = scanPoint(point);
    auto params = std::make_unique<TraceDataParams>();
    params->name = textOf(point, TracePointDescription);
    params->kind = kind_;
    params->beginCode = codes.begin;
    params->endCode = kind_ == kTracePointImpulse ? codes.begin : codes.end;
    params->matchedByThread = textOf(point, TracePointEventsMatchedBy) == TracePointEventsMatchedByThread;
    params_->dataParams.push_back(std::move(params));
    // One line with a break in it: wanted. Signed, as it has always been shown.
    traceLog().info("Loading tracepoint : %d and %d \n finished parsing.", static_cast<std::int32_t>(codes.begin),
                    static_cast<std::int32_t>(codes.end));
}

/// Sets the kind, too.
ScannedCodes Loading::scanPoint(const Dictionary& point) {
    const std::string type = textOf(point, TracePointType);
    ScannedCodes codes;
    if (type == TracePointTypeInterval) {
        kind_ = kTracePointInterval;
        codes.end = traceEventCodeOf(textOf(point, TracePointEndCode));
    } else if (type == TracePointTypeImpulse) {
        kind_ = kTracePointImpulse;
    } else if (type == TracePointTypeLevel) {
        kind_ = kTracePointLevel;
    } else {
        traceLog().error("TracePointType field not recognized or is empty.");
        return codes;
    }
    codes.begin = traceEventCodeOf(textOf(point, TracePointBeginCode));
    return codes;
}

} // namespace

TraceParamsParser TraceParamsParser::initWithFileName(std::string name, std::optional<platform::Identity> client,
                                                      const TraceParamsPlatform& tracePlatform) {
    return {std::move(name), std::move(client), tracePlatform};
}

TraceParamsParser::TraceParamsParser(std::string name, std::optional<platform::Identity> client,
                                     const TraceParamsPlatform& tracePlatform)
    : traceParamsFile_(std::move(name)),
      client_(std::move(client)),
      platform_(tracePlatform) {}

std::unique_ptr<TraceParams> TraceParamsParser::loadTraceParams() const {
    return Loading(platform_.propertyListReading).load(readPropertyList());
}

/// None after a failure, which is logged. A file that cannot be read is none that could be parsed, and both are told.
Value TraceParamsParser::readPropertyList() const {
    const Result<std::string> bytes = readBytes();
    if (!bytes) {
        logReadingFailure(bytes.failure());
    }
    Result<Value> parsed = bytes ? platform_.propertyListReading.read(*bytes, {.bytes = kTraceParamsFileBytes})
                                 : Failure{0, "property list: there is nothing to read"};
    if (!parsed) {
        logReadingFailure(parsed.failure());
        traceLog().error("No valid input found in plist.");
        return {};
    }
    return *std::move(parsed);
}

Result<std::string> TraceParamsParser::readBytes() const {
    const std::string whole = path();
    if (!client_) {
        return Failure{EACCES, "open " + whole + ": nobody can tell which user named it"};
    }
    return platform_.fileSystem.readFileFor(*client_, whole, kTraceParamsFileBytes);
}

std::string TraceParamsParser::path() const {
    if (traceParamsFile_.starts_with('/')) {
        return traceParamsFile_;
    }
    std::string whole = platform_.fileSystem.currentDirectory();
    if (!traceParamsFile_.empty()) {
        whole += whole.ends_with('/') ? "" : "/";
        whole += traceParamsFile_;
    }
    return whole;
}

std::uint32_t traceEventCodeOf(std::string_view text) {
    if (text.starts_with("0x") || text.starts_with("0X")) {
        text.remove_prefix(2);
    }
    std::uint32_t code = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), code, 16);
    return error == std::errc::result_out_of_range ? std::numeric_limits<std::uint32_t>::max() : code;
}

} // namespace vela
