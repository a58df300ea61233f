#include "tracing/ChromeTrace.h"

#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <charconv>
#include <cstddef>
#include <vector>

namespace vela {

namespace {

constexpr std::size_t kPieceBytes = std::size_t{1} << 20U;

template <class Integer>
void appendInteger(std::string& text, Integer number) {
    char digits[24];
    text.append(digits, std::to_chars(digits, digits + sizeof(digits), number).ptr);
}

/// Without the rounding of a floating-point number: 1234567 is "1234.567".
void appendMicroseconds(std::string& text, std::uint64_t nanoseconds) {
    constexpr std::uint64_t kNanoseconds = 1000;
    appendInteger(text, nanoseconds / kNanoseconds);
    std::uint64_t fraction = nanoseconds % kNanoseconds;
    if (fraction == 0) {
        return;
    }
    text += '.';
    for (std::uint64_t unit = kNanoseconds / 10; fraction != 0; fraction %= unit, unit /= 10) {
        text += static_cast<char>('0' + fraction / unit);
    }
}

/// `text` as a JSON string.
std::string jsonString(std::string_view text) {
    std::string json;
    appendJsonString(json, text);
    return json;
}

} // namespace

ChromeTrace::ChromeTrace(platform::PendingFile& file, const ChromeTraceFacts& facts) : file_(file) {
    const Dictionary otherData{{"writer", facts.writer},
                               {"version", facts.version},
                               {"intervalsLeftOut", facts.intervalsLeftOut},
                               {"lostEvents", facts.lostEvents}};
    piece_ = "{\"displayTimeUnit\":\"ns\",\n\"otherData\":" + jsonText(Value(otherData)) + ",\n\"traceEvents\":[\n";
}

void ChromeTrace::add(const Trace& trace) {
    const std::string category = jsonString(trace.name());
    std::vector<std::string> names;
    names.reserve(trace.intervals().size());
    for (const auto& interval : trace.intervals()) {
        names.push_back(jsonString(interval->name()));
    }
    for (const TraceSpan& span : trace.timeline().spans()) {
        add(span, category, names[span.interval]);
    }
}

void ChromeTrace::add(const TraceSpan& span, const std::string& category, const std::string& name) {
    piece_ += first_ ? "" : ",\n";
    first_ = false;
    piece_.append("{\"ph\":\"X\",\"name\":").append(name).append(",\"cat\":").append(category).append(",\"ts\":");
    appendMicroseconds(piece_, span.begin);
    piece_ += ",\"dur\":";
    appendMicroseconds(piece_, span.end - span.begin);
    piece_ += ",\"pid\":";
    appendInteger(piece_, span.process);
    piece_ += ",\"tid\":";
    appendInteger(piece_, span.beginThread);
    if (span.endThread != span.beginThread) {
        piece_ += ",\"args\":{\"endThread\":";
        appendInteger(piece_, span.endThread);
        piece_ += '}';
    }
    piece_ += '}';
    if (piece_.size() >= kPieceBytes) {
        file_.append(piece_);
        piece_.clear();
    }
}

void ChromeTrace::finish() {
    piece_ += first_ ? "]}\n" : "\n]}\n";
    file_.append(piece_);
    piece_.clear();
}

} // namespace vela
