// Pages as the kernel's trace buffer gives them out, built by hand, for tests. On machines that store the lower byte
// first.
#pragma once

#include "platform/spoor/FtracePage.h"

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

namespace vela::platform::spoor {

/// The kernel's own texts, of a 64-bit machine.
inline constexpr const char* kHeaderPage = "\tfield: u64 timestamp;\toffset:0;\tsize:8;\tsigned:0;\n"
                                           "\tfield: local_t commit;\toffset:8;\tsize:8;\tsigned:1;\n"
                                           "\tfield: int overwrite;\toffset:8;\tsize:1;\tsigned:1;\n"
                                           "\tfield: char data;\toffset:16;\tsize:4080;\tsigned:0;\n";
inline constexpr const char* kRawDataFormat =
    "name: raw_data\nID: 19\nformat:\n"
    "\tfield:unsigned short common_type;\toffset:0;\tsize:2;\tsigned:0;\n"
    "\tfield:unsigned char common_flags;\toffset:2;\tsize:1;\tsigned:0;\n"
    "\tfield:unsigned char common_preempt_count;\toffset:3;\tsize:1;\tsigned:0;\n"
    "\tfield:int common_pid;\toffset:4;\tsize:4;\tsigned:1;\n\n"
    "\tfield:unsigned int id;\toffset:8;\tsize:4;\tsigned:0;\n"
    "\tfield:char buf[];\toffset:12;\tsize:0;\tsigned:0;\n\n"
    "print fmt: \"id:%04x %08x\", REC->id, (int)REC->buf[0]\n";

class BuiltPage {
public:
    explicit BuiltPage(std::uint64_t time = 1'000'000) { put(time); }

    BuiltPage& word(std::uint32_t kind, std::uint32_t time) {
        data_.append(bytesOf((time << 5U) | kind));
        return *this;
    }
    BuiltPage& next(std::uint32_t word) {
        data_.append(bytesOf(word));
        return *this;
    }
    BuiltPage& raw(const std::string& bytes) {
        data_ += bytes;
        return *this;
    }
    /// A marker `delta` after the event before.
    BuiltPage& marker(std::uint32_t delta, std::uint32_t thread, std::uint32_t code, const TraceArguments& arguments,
                      std::uint16_t eventID = 19) {
        return word(12, delta).raw(event(thread, code, arguments, eventID));
    }
    /// Kernels store events of another size behind a word that tells it.
    BuiltPage& longMarker(std::uint32_t delta, std::uint32_t thread, std::uint32_t code,
                          const TraceArguments& arguments) {
        const std::string content = event(thread, code, arguments, 19);
        return word(0, delta).next(static_cast<std::uint32_t>(content.size() + 4)).raw(content);
    }

    static std::string event(std::uint32_t thread, std::uint32_t code, const TraceArguments& arguments,
                             std::uint16_t eventID, std::uint32_t words = 4) {
        std::string bytes =
            bytesOf(eventID) + std::string(2, '\0') + bytesOf(thread) + bytesOf(code) + bytesOf(words | (77U << 8U));
        for (const std::uint64_t argument : arguments) {
            bytes += bytesOf(argument);
        }
        return bytes;
    }

    std::vector<char> page(std::uint64_t flags = 0, const std::string& behind = "") const {
        std::string bytes = time_ + bytesOf(static_cast<std::uint64_t>(data_.size()) | flags) + data_ + behind;
        bytes.resize(4096, '\0');
        return {bytes.begin(), bytes.end()};
    }

private:
    template <class Word>
    static std::string bytesOf(Word word) {
        std::string bytes(sizeof(word), '\0');
        std::memcpy(bytes.data(), &word, sizeof(word));
        return bytes;
    }
    void put(std::uint64_t time) { time_ = bytesOf(time); }

    std::string time_;
    std::string data_;
};

} // namespace vela::platform::spoor
