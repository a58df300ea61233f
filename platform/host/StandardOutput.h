// Standard output as a stream that keeps the reason when it cannot be written. Lines go to a terminal one by one and
// elsewhere in blocks; what is printed on std::cerr comes behind what was printed here before. Confined to its owner's
// thread; one at a time, which std::cerr outlives.
#pragma once

#include <ostream>
#include <streambuf>
#include <string>
#include <string_view>

namespace vela::platform {

/// A buffer before a file descriptor. After a write that failed it takes nothing more.
class DescriptorBuffer final : public std::streambuf {
public:
    /// The descriptor stays its owner's.
    DescriptorBuffer(int descriptor, bool lineByLine) : descriptor_(descriptor), lineByLine_(lineByLine) {}

    /// Why the first write that failed did; 0 without one.
    int error() const { return error_; }

protected:
    int_type overflow(int_type byte) override;
    std::streamsize xsputn(const char* text, std::streamsize count) override;
    int sync() override;

private:
    bool append(std::string_view text);
    bool writePending();
    bool waitUntilWritable() const;

    const int descriptor_;
    const bool lineByLine_;
    std::string pending_;
    int error_ = 0;
};

class StandardOutput {
public:
    static constexpr int kDescriptor = 1;

    explicit StandardOutput(int descriptor = kDescriptor);
    ~StandardOutput();
    StandardOutput(const StandardOutput&) = delete;
    StandardOutput& operator=(const StandardOutput&) = delete;

    std::ostream& stream() { return stream_; }
    bool isTerminal() const { return terminal_; }

    /// Whether a pipe's reader has closed it: nobody will see what is written from now on.
    bool isReaderGone() const;

    /// Writes the rest. Where anything could not be written it says so on `error` as `program`, but nothing when only
    /// the reader of a pipe has gone, and answers false.
    bool finish(std::string_view program, std::ostream& error);

private:
    const int descriptor_;
    const bool terminal_;
    DescriptorBuffer buffer_;
    std::ostream stream_;
    std::ostream* const tiedBefore_; ///< to std::cerr
};

} // namespace vela::platform
